#include "skin.h"

#include <array>
#include <cmath>
#include <limits>
#include <string>

#include <tbb/blocked_range.h>
#include <tbb/parallel_for.h>

#include "arrays.h"
#include "influences.h"

namespace tessik::python {

namespace {

using TessikSDK::Geom::Matrix3FromRowMajor4x4;

constexpr double kIdentity[16] = {1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};

void makeReadOnly(py::array& array) { array.attr("flags").attr("writeable") = false; }

int countWithin(py::ssize_t n, const char* name, const char* what) {
  if (n > std::numeric_limits<int>::max())
    fail(name, std::string("has more ") + what + " than the engine holds");
  return static_cast<int>(n);
}

}  // namespace

Skin::Skin(py::handle bindMatrices, py::handle boneIndices, py::handle weights, py::handle objectMatrix) {
  const DoubleArray bind = affineMatrices(bindMatrices, "bind_matrices", {-1, 4, 4}, "(B, 4, 4)");
  if (bind.shape(0) == 0) fail("bind_matrices", "is empty: a skin needs at least one bone");
  numBones_ = countWithin(bind.shape(0), "bind_matrices", "bones");
  const Influences in = readInfluences(boneIndices, weights, numBones_);
  numPoints_ = countWithin(in.boneIndices.shape(0), "bone_indices", "rows");
  const DoubleArray object = objectMatrix.is_none()
                                 ? DoubleArray({4, 4}, kIdentity)
                                 : affineMatrices(objectMatrix, "object_matrix", {4, 4}, "(4, 4)");

  // Used entries move to the front of each row, so the engine's influence count skips the padding
  // and never meets bone -1.
  const py::ssize_t columns = in.boneIndices.shape(1);
  boneIds_ = py::array_t<std::int32_t, py::array::c_style>({static_cast<py::ssize_t>(numPoints_), columns});
  weights_ = py::array_t<float, py::array::c_style>({static_cast<py::ssize_t>(numPoints_), columns});
  std::int32_t* ids = boneIds_.mutable_data();
  float* w = weights_.mutable_data();
  std::vector<int> used(static_cast<std::size_t>(numPoints_), 0);
  for (py::ssize_t v = 0; v < numPoints_; ++v) {
    int& n = used[static_cast<std::size_t>(v)];
    for (py::ssize_t j = 0; j < columns; ++j) {
      const std::int64_t bone = in.boneIndices.data()[v * columns + j];
      if (bone < 0) continue;
      const auto weight = static_cast<float>(in.weights.data()[v * columns + j]);
      if (!std::isfinite(weight)) {
        fail("weights[" + std::to_string(v) + ", " + std::to_string(j) + "]", "is too large for float32");
      }
      ids[v * columns + n] = static_cast<std::int32_t>(bone);
      w[v * columns + n] = weight;
      ++n;
    }
    for (py::ssize_t j = n; j < columns; ++j) {
      ids[v * columns + j] = -1;
      w[v * columns + j] = 0.0f;
    }
  }

  engine_.SetNumBones(numBones_);
  engine_.SetNumPoints(numPoints_);
  engine_.SetInitTM(Matrix3FromRowMajor4x4(object.data()));
  for (int b = 0; b < numBones_; ++b) {
    const TessikSDK::Geom::Matrix3 m = Matrix3FromRowMajor4x4(bind.data() + 16 * b);
    engine_.SetInitBoneTM(b, m);
    engine_.SetBoneTM(b, m);
  }
  for (int v = 0; v < numPoints_; ++v) {
    engine_.SetPointData(v, used[static_cast<std::size_t>(v)], sizeof(std::int32_t), ids + v * columns,
                         sizeof(float), w + v * columns, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0,
                         nullptr);
  }
  makeReadOnly(boneIds_);
  makeReadOnly(weights_);
}

py::array_t<float> Skin::deform(py::handle pointsObject, py::handle boneMatricesObject) {
  const py::array raw = asArray(pointsObject, "points");
  const std::string pointsPattern = "(" + std::to_string(numPoints_) + ", 3), one row per skinned point";
  requireShape(raw, "points", {numPoints_, 3}, pointsPattern.c_str());
  const FloatArray points = realAsFloat(raw, "points");
  const std::string bonesPattern = "(" + std::to_string(numBones_) + ", 4, 4), one matrix per bone";
  const DoubleArray matrices =
      affineMatrices(boneMatricesObject, "bone_matrices", {numBones_, 4, 4}, bonesPattern.c_str());
  std::vector<TessikSDK::Geom::Matrix3> rows(static_cast<std::size_t>(numBones_));
  for (int b = 0; b < numBones_; ++b)
    rows[static_cast<std::size_t>(b)] = Matrix3FromRowMajor4x4(matrices.data() + 16 * b);

  py::array_t<float> out({static_cast<py::ssize_t>(numPoints_), py::ssize_t{3}});
  float* target = out.mutable_data();
  // MapPoint only reads its input; the engine's signature is simply not const-correct.
  float* source = const_cast<float*>(points.data());
  {
    py::gil_scoped_release release;
    std::lock_guard<std::mutex> lock(mutex_);
    for (int b = 0; b < numBones_; ++b) engine_.SetBoneTM(b, rows[static_cast<std::size_t>(b)]);
    engine_.PreComputeBoneXFormTMs();
    tbb::parallel_for(tbb::blocked_range<int>(0, numPoints_, 4096),
                      [&](const tbb::blocked_range<int>& range) {
                        for (int i = range.begin(); i != range.end(); ++i)
                          engine_.MapPoint(i, source + 3 * i, target + 3 * i);
                      });
  }
  return out;
}

}  // namespace tessik::python
