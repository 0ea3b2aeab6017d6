#pragma once

#include <stdexcept>

#include <pybind11/pybind11.h>

namespace tessik::python {

// Raised as tessik.BindingError: the library returned no weights for valid-looking input.
class BindingFailed : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Raised as tessik.OpenGLUnavailableError: no OpenGL 2.1 context was current and none could be made.
class OpenGLUnavailable : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

enum class BindMethod { Heatmap, Geodesic };

struct BindOptions {
  BindMethod method = BindMethod::Heatmap;
  double falloff = 0.5;
  long long maxInfluences = 4;
  long long resolution = 64;  // also checked for the heat method, whose callers keep the default
  bool refineInterior = false;
  bool leafTips = true;
  bool verbose = false;
  std::string voxelizer = "auto";  // geodesic: "auto", "gpu" or "cpu"
};

// Validates the inputs, binds with the GIL released and returns (bone_indices, weights), both (V, k)
// and padded with -1 and 0. `names` and `progress` may be None.
pybind11::tuple bind(pybind11::handle vertices,
                     pybind11::handle triangles,
                     pybind11::handle joints,
                     pybind11::handle parents,
                     pybind11::handle names,
                     const BindOptions& options,
                     pybind11::object progress);

}  // namespace tessik::python
