#pragma once

#include <cstdint>
#include <mutex>
#include <vector>

#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>

#include <tessik/corvane.h>

namespace tessik::python {

namespace py = pybind11;

// tessik.Skin: one CCorvane engine over influence arrays the Skin owns. The engine keeps raw pointers
// into them, so they are private copies that live exactly as long as the engine and never change.
class Skin {
 public:
  Skin(py::handle bindMatrices, py::handle boneIndices, py::handle weights, py::handle objectMatrix);
  Skin(const Skin&) = delete;
  Skin& operator=(const Skin&) = delete;

  // (V, 3) float32: every point moved by the pose `boneMatrices`, (B, 4, 4).
  py::array_t<float> deform(py::handle points, py::handle boneMatrices);

  int numBones() const { return numBones_; }
  int numPoints() const { return numPoints_; }
  // Read-only views of the packed influences the engine reads (used entries first in every row).
  py::array boneIndices() const { return boneIds_; }
  py::array weights() const { return weights_; }

 private:
  TessikSDK::Corvane::CCorvane engine_;
  int numBones_ = 0;
  int numPoints_ = 0;
  py::array_t<std::int32_t, py::array::c_style> boneIds_;
  py::array_t<float, py::array::c_style> weights_;
  // deform() runs without the GIL, and the engine's setters must not overlap with anything.
  std::mutex mutex_;
};

}  // namespace tessik::python
