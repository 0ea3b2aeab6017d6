#pragma once

#include <cstdint>
#include <optional>

#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>

#include "arrays.h"

namespace tessik::python {

// Per-point influence arrays as the bindings return them: (V, k) bone indices, -1 where unused, and
// weights, 0 where unused.
struct Influences {
  Int64Array boneIndices;
  DoubleArray weights;
  // Largest index plus one when the caller gave no bone count.
  std::int64_t numBones = 0;
};

// Validates both arrays together: same (V, k) shape, indices in [-1, numBones) (numBones < 0: any
// index >= -1), finite weights, and weight 0 wherever the index is -1.
Influences readInfluences(py::handle boneIndices, py::handle weights, std::int64_t numBones);

// The (V, B) float64 matrix of the weights, B = numBones or the largest index plus one; repeated bones
// in a row add up.
py::array denseWeights(py::handle boneIndices, py::handle weights, std::optional<long long> numBones);

}  // namespace tessik::python
