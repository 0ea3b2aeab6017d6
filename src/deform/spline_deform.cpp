#include <cmath>

#include "tessik/corvane.h"

#include "deform/strided_view.h"

namespace TessikSDK::Corvane {

using Geom::Matrix3;
using Geom::Point3;

Point3 CCorvane::SplineDeformPoint(int pointIndex, int influence, const float* point) const {
  const CPointDataClass& record = points[pointIndex];
  const int j = influence;
  const int b = StridedView<std::int32_t>(record.boneIDs, record.boneIDStride)[j];
  const CBoneDataClass& bone = bones[b];
  const int c = StridedView<std::int32_t>(record.curveIDs, record.curveIDStride)[j];
  const int k = StridedView<std::int32_t>(record.pieceIDs, record.pieceIDStride)[j];
  const float u = StridedView<float>(record.uValues, record.uStride)[j];

  // Spline bone space (now) to object space; spline influences work from the live transform, not the
  // cached one.
  const Matrix3 m = Geom::Inverse(initTM * Geom::Inverse(bone.currentTM));
  const Point3 a = GetInterpCurvePiece3D(b, c, k, u) * m;
  Point3 t = Geom::VectorTransform(m, GetTangentPiece3D(b, c, k, u));
  const Point3 c0 = StridedView<Point3>(record.initPositions, record.initPositionStride)[j] * m;
  Point3 d = Geom::VectorTransform(m, StridedView<Point3>(record.initTangents, record.initTangentStride)[j]);

  const float w = StridedView<float>(record.weights, record.weightStride)[j];
  d = d.Normalize();
  t = t.Normalize();

  Matrix3 rotation;
  if (t != d) {
    const float dot = Geom::DotProd(t, d);
    float angle = 0.0f;
    // |dot| near 1 covers nearly opposite tangents too: those are left unturned rather than spun
    // about an axis that rounding picked.
    if (std::fabs(1.0 - std::fabs(static_cast<double>(dot))) >= static_cast<double>(1e-6f)) {
      angle = std::acos(dot) * w;
    }
    if (dot != 1.0f) rotation = Geom::RotAngleAxisMatrix(d.CrossProd(t).Normalize(), angle);
  }
  return (a - c0) * w + (c0 + ((Point3(point) - c0) * rotation));
}

}  // namespace TessikSDK::Corvane
