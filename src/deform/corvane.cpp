#include "tessik/corvane.h"

#include <cstddef>
#include <stdexcept>

#include <tbb/blocked_range.h>
#include <tbb/parallel_for.h>
#include <tbb/partitioner.h>
#include <tbb/task_group.h>

#include "deform/strided_view.h"

namespace TessikSDK::Corvane {

using Geom::Matrix3;
using Geom::Point3;

namespace {

// Small enough that a few thousand bones still spread over every worker; each bone costs two
// inversions and three products, so finer chunks would be mostly scheduling.
constexpr std::size_t kBonesPerTask = 10;

const Matrix3& CachedXForm(const CBoneDataClass& bone) {
  if (bone.xFormValid == 0) {
    throw std::runtime_error(
        "TessikSDK::Corvane::CBoneDataClass::GetXFormTM : The CurrentTM matrix has been set after the XForm "
        "computation. Value is invalid now. Remember to call PreComputeXFormTM() before calling "
        "GetXFormTM().");
  }
  return bone.xFormTM;
}

void CheckCount(int count) {
  if (count < 0) Util::ThrowIndexOutOfRange();
}

void Store(const Point3& p, float* out) {
  out[0] = p.x;
  out[1] = p.y;
  out[2] = p.z;
}

}  // namespace

CCorvane::CCorvane() : useSplineAnimation(false) {}

CCorvane::~CCorvane() = default;

Point3 CCorvane::GetInterpCurvePiece3D(int, int, int, float) const { return Point3(0, 0, 0); }

Point3 CCorvane::GetTangentPiece3D(int, int, int, float) const { return Point3(0, 0, 0); }

long CCorvane::SetNumBones(int numBones) {
  CheckCount(numBones);
  if (static_cast<std::uint64_t>(numBones) == bones.UsedLength()) return 0;
  // Value-initialisation zeroes every byte, then the matrices construct themselves as identities.
  const CBoneDataClass fresh = CBoneDataClass();
  bones.SetLength(static_cast<std::uint64_t>(numBones), fresh);
  return 0;
}

long CCorvane::SetNumPoints(int numPoints) {
  CheckCount(numPoints);
  const CPointDataClass fresh = CPointDataClass();
  points.SetLength(static_cast<std::uint64_t>(numPoints), fresh);
  return 0;
}

long CCorvane::SetPointData(int pointIndex,
                            int numData,
                            std::uint32_t boneIDStride,
                            int* boneIDs,
                            std::uint32_t weightStride,
                            float* weights,
                            std::uint32_t curveIDStride,
                            int* curveIDs,
                            std::uint32_t pieceIDStride,
                            int* pieceIDs,
                            std::uint32_t uStride,
                            float* uValues,
                            std::uint32_t initTangentStride,
                            float* initTangents,
                            std::uint32_t initPositionStride,
                            float* initPositions) {
  CPointDataClass& point = points[pointIndex];
  point.numData = numData;
  point.boneIDs = boneIDs;
  point.boneIDStride = boneIDStride;
  point.weights = weights;
  point.weightStride = weightStride;
  point.curveIDs = curveIDs;
  point.curveIDStride = curveIDStride;
  point.pieceIDs = pieceIDs;
  point.pieceIDStride = pieceIDStride;
  point.uValues = uValues;
  point.uStride = uStride;
  point.initTangents = initTangents;
  point.initTangentStride = initTangentStride;
  point.initPositions = initPositions;
  point.initPositionStride = initPositionStride;
  return 0;
}

long CCorvane::SetBoneTM(int boneIndex, const Matrix3& tm) {
  CBoneDataClass& bone = bones[boneIndex];
  bone.xFormValid = 0;
  bone.currentTM = tm;
  return 0;
}

long CCorvane::SetBoneTM(int boneIndex, float* tm) { return SetBoneTM(boneIndex, Matrix3::FromFloats(tm)); }

long CCorvane::SetInitBoneTM(int boneIndex, const Matrix3& tm) {
  CBoneDataClass& bone = bones[boneIndex];
  bone.xFormValid = 0;
  bone.initBoneTM = tm;
  return 0;
}

long CCorvane::SetInitBoneTM(int boneIndex, float* tm) {
  return SetInitBoneTM(boneIndex, Matrix3::FromFloats(tm));
}

long CCorvane::SetInitTM(const Matrix3& tm) {
  initTM = tm;
  return 0;
}

long CCorvane::SetInitTM(float* tm) { return SetInitTM(Matrix3::FromFloats(tm)); }

long CCorvane::SetBoneFlags(int boneIndex, std::uint32_t flags) {
  bones[boneIndex].flags = flags;
  return 0;
}

void CCorvane::SetUseSplineAnimation(bool on) { useSplineAnimation = on; }

bool CCorvane::UseSplineAnimation() { return useSplineAnimation; }

void CCorvane::PreComputeBoneXFormTMs() {
  const std::size_t count = static_cast<std::size_t>(bones.UsedLength());
  if (count == 0) return;
  // Inverse is a pure function, so taking Inverse(initTM) once gives every bone the same bits as
  // taking it per bone.
  const Matrix3 objectFromWorld = Geom::Inverse(initTM);
  tbb::task_group_context context;
  tbb::parallel_for(
      tbb::blocked_range<std::size_t>(0, count, kBonesPerTask),
      [this, &objectFromWorld](const tbb::blocked_range<std::size_t>& range) {
        for (std::size_t i = range.begin(); i != range.end(); ++i) {
          CBoneDataClass& bone = bones[static_cast<int>(i)];
          bone.xFormTM = initTM * Geom::Inverse(bone.initBoneTM) * bone.currentTM * objectFromWorld;
          bone.xFormValid = 1;
        }
      },
      tbb::simple_partitioner(), context);
}

long CCorvane::MapPoint(int pointIndex, float* inPoint, float* outPoint) const {
  const CPointDataClass& point = points[pointIndex];
  // Copied first: inPoint and outPoint may alias.
  const Point3 p(inPoint);
  if (point.numData < 1) {
    Store(p, outPoint);
    return 0;
  }
  const StridedView<std::int32_t> boneIDs(point.boneIDs, point.boneIDStride);
  const StridedView<float> weights(point.weights, point.weightStride);

  if (point.numData == 1) {
    const float w = weights[0];
    const CBoneDataClass& bone = bones[boneIDs[0]];
    const Point3 q = p * CachedXForm(bone);
    Point3 r = p + (q - p) * w;
    if (useSplineAnimation && (bone.flags & SPLINE_BONE_FLAG) != 0 && w != 0.0f) {
      const float blended[3] = {r.x, r.y, r.z};
      r = SplineDeformPoint(pointIndex, 0, blended);
    }
    Store(r, outPoint);
    return 0;
  }

  float sum = 0.0f;
  Point3 acc(0.0f, 0.0f, 0.0f);
  for (int j = 0; j < point.numData; ++j) {
    const float w = weights[j];
    if (w == 0.0f) continue;  // NaN is not equal to 0 and goes on to poison the sum
    const Point3 q = p * CachedXForm(bones[boneIDs[j]]);
    acc.x += w * q.x;
    acc.y += w * q.y;
    acc.z += w * q.z;
    sum += w;
  }
  if (useSplineAnimation) {
    for (int j = 0; j < point.numData; ++j) {
      const CBoneDataClass& bone = bones[boneIDs[j]];
      if ((bone.flags & SPLINE_BONE_FLAG) != 0 && weights[j] != 0.0f) {
        const float blended[3] = {acc.x, acc.y, acc.z};
        acc = SplineDeformPoint(pointIndex, j, blended);
      }
    }
  }
  Store(static_cast<double>(sum) > 1e-5 ? acc : p, outPoint);
  return 0;
}

}  // namespace TessikSDK::Corvane
