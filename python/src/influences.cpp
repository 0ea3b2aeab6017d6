#include "influences.h"

#include <algorithm>
#include <cstring>
#include <string>

namespace tessik::python {

Influences readInfluences(py::handle boneIndicesObject, py::handle weightsObject, std::int64_t numBones) {
  const py::array rawIndices = asArray(boneIndicesObject, "bone_indices");
  requireShape(rawIndices, "bone_indices", {-1, -1}, "(V, k)");
  const py::array rawWeights = asArray(weightsObject, "weights");
  if (rawWeights.ndim() != 2 || rawWeights.shape(0) != rawIndices.shape(0) ||
      rawWeights.shape(1) != rawIndices.shape(1)) {
    fail("weights",
         "must have the shape of bone_indices, " + shapeText(rawIndices) + ", got " + shapeText(rawWeights));
  }
  Influences out{integerAsInt64(rawIndices, "bone_indices"), realAsDouble(rawWeights, "weights"), numBones};
  const auto rows = static_cast<std::size_t>(out.boneIndices.shape(0));
  const auto columns = static_cast<std::size_t>(out.boneIndices.shape(1));
  requireFinite(out.weights.data(), rows, columns, "weights");

  const std::int64_t* index = out.boneIndices.data();
  const double* weight = out.weights.data();
  std::int64_t largest = -1;
  for (std::size_t i = 0; i < rows * columns; ++i) {
    const std::string at = "[" + std::to_string(i / columns) + ", " + std::to_string(i % columns) + "]";
    const bool tooLarge = numBones >= 0 && index[i] >= numBones;
    if (index[i] < -1 || tooLarge) {
      fail("bone_indices" + at, "= " + std::to_string(index[i]) + " is out of range: use -1 for an unused " +
                                    "entry or a bone index" +
                                    (numBones >= 0 ? " below " + std::to_string(numBones) : std::string()));
    }
    if (index[i] == -1 && weight[i] != 0.0) {
      fail("weights" + at,
           "must be 0 where bone_indices is -1 (an unused entry), got " + std::to_string(weight[i]));
    }
    largest = std::max(largest, index[i]);
  }
  if (numBones < 0) out.numBones = largest + 1;
  return out;
}

py::array denseWeights(py::handle boneIndices, py::handle weights, std::optional<long long> givenBones) {
  std::int64_t numBones = -1;
  if (givenBones.has_value()) {
    numBones = *givenBones;
    if (numBones < 0) fail("num_bones", "must be at least 0, got " + std::to_string(numBones));
  }
  const Influences in = readInfluences(boneIndices, weights, numBones);
  const py::ssize_t rows = in.boneIndices.shape(0);
  const py::ssize_t columns = in.boneIndices.shape(1);
  DoubleArray dense({rows, static_cast<py::ssize_t>(in.numBones)});
  double* out = dense.mutable_data();
  std::fill(out, out + dense.size(), 0.0);
  for (py::ssize_t v = 0; v < rows; ++v) {
    for (py::ssize_t j = 0; j < columns; ++j) {
      const std::int64_t bone = in.boneIndices.data()[v * columns + j];
      if (bone >= 0) out[v * in.numBones + bone] += in.weights.data()[v * columns + j];
    }
  }
  return std::move(dense);
}

}  // namespace tessik::python
