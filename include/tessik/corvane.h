#pragma once

#include <cstdint>

#include <tessik/array.h>
#include <tessik/export.h>
#include <tessik/geom.h>
#include <tessik/util.h>

namespace TessikSDK::Corvane {

/// Bone flag bit: the bone is a spline bone whose influences follow one of its curves.
constexpr std::uint32_t SPLINE_BONE_FLAG = 0x4;

/// One bone of the engine.
struct CBoneDataClass {
  Geom::Matrix3 xFormTM;     ///< cached deformation transform (object space to object space)
  Geom::Matrix3 initBoneTM;  ///< the bone's transform at bind time
  Geom::Matrix3 currentTM;   ///< the bone's transform now
  std::uint32_t flags;       ///< host bits; only SPLINE_BONE_FLAG is read
  std::int32_t xFormValid;   ///< 1 while xFormTM reflects initBoneTM and currentTM
};

/// One deformable point: its influence count and seven caller-owned strided streams. Element j of a
/// stream lies `j * stride` bytes (a 32-bit unsigned product) past its pointer.
struct CPointDataClass {
  std::int32_t numData;
  std::int32_t* boneIDs;
  std::uint32_t boneIDStride;
  float* weights;
  std::uint32_t weightStride;
  std::int32_t* curveIDs;
  std::uint32_t curveIDStride;
  std::int32_t* pieceIDs;
  std::uint32_t pieceIDStride;
  float* uValues;
  std::uint32_t uStride;
  float* initTangents;  ///< three floats per element
  std::uint32_t initTangentStride;
  float* initPositions;  ///< three floats per element
  std::uint32_t initPositionStride;
};

/// The skin deformation engine of one skinned object.
///
/// Calling order: SetNumBones, SetNumPoints, SetInitTM, per bone SetInitBoneTM/SetBoneTM/SetBoneFlags,
/// per point SetPointData, SetUseSplineAnimation; then per frame SetBoneTM for the bones that moved,
/// PreComputeBoneXFormTMs, and MapPoint for any points in any order.
///
/// Matrices are affine, four rows (X, Y, Z axes, translation); a matrix given as `float*` is those
/// twelve floats in row order. Every `long` result is 0: failures are exceptions.
/// - A bad bone or point index throws Util::OutOfRangeException with the message
///   Util::kArrayIndexOutOfBoundsMessage; the engine is unchanged.
/// - Mapping a point through a bone whose transform changed after PreComputeBoneXFormTMs throws
///   std::runtime_error.
///
/// Threads: setters and PreComputeBoneXFormTMs must not overlap with anything else on the same engine.
/// MapPoint is const and may run on several threads at once between them.
class TESSIK_API CCorvane : public Util::TessikHeapOperators {
 public:
  CCorvane();
  virtual ~CCorvane();

  /// Position on piece `piece` of curve `curve` of spline bone `bone` at parameter `u`, in the bone's
  /// space. Hosts override this to evaluate their curves; the engine's own answer is (0, 0, 0). Called
  /// from every thread that maps points.
  virtual Geom::Point3 GetInterpCurvePiece3D(int bone, int curve, int piece, float u) const;
  /// Tangent at the same place, in the bone's space. Same contract as GetInterpCurvePiece3D.
  virtual Geom::Point3 GetTangentPiece3D(int bone, int curve, int piece, float u) const;

  /// Resizes the bones. Growing keeps every bone and adds identity-matrix bones with flags 0 and an
  /// invalid cached transform; shrinking keeps the first `numBones`. The current count is a no-op.
  /// @throws Util::OutOfRangeException for a negative count (nothing changes).
  long SetNumBones(int numBones);
  /// Resizes the points as SetNumBones does; new points have no influences and null streams.
  /// @throws Util::OutOfRangeException for a negative count (nothing changes).
  long SetNumPoints(int numPoints);

  /// Stores `numData` and the seven stream pointers with their byte strides for one point. Nothing is
  /// read or copied here: the caller keeps the memory alive and unchanged while points are mapped. The
  /// curve streams (curve, piece, u, tangent, position) are read only for influences on spline bones
  /// while spline animation is on, and may be null otherwise.
  long SetPointData(int pointIndex,
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
                    float* initPositions);

  /// The bone's current transform (bone space to world space). Invalidates its cached transform.
  long SetBoneTM(int boneIndex, const Geom::Matrix3& tm);
  long SetBoneTM(int boneIndex, float* tm);
  /// The bone's bind-time transform. Invalidates its cached transform.
  long SetInitBoneTM(int boneIndex, const Geom::Matrix3& tm);
  long SetInitBoneTM(int boneIndex, float* tm);
  /// The skinned object's bind-time transform (object space to world space). Cached bone transforms
  /// stay marked valid: call PreComputeBoneXFormTMs again for the change to take effect.
  long SetInitTM(const Geom::Matrix3& tm);
  long SetInitTM(float* tm);
  /// Stores the host's flag bits for one bone; the cached transform stays valid.
  long SetBoneFlags(int boneIndex, std::uint32_t flags);

  void SetUseSplineAnimation(bool on);
  bool UseSplineAnimation();

  /// Caches every bone's deformation transform, initTM * Inverse(initBoneTM) * currentTM *
  /// Inverse(initTM), and marks it valid. Runs in parallel on TBB (chunks of at most 10 bones); the
  /// result does not depend on the thread count.
  void PreComputeBoneXFormTMs();

  /// Maps point `pointIndex` from its bind-time position `inPoint` (x, y, z in object space) to its
  /// deformed position in `outPoint`. The two may be the same three floats. Weights are not
  /// normalised; a point whose weights sum to at most 1e-5 maps to itself. `outPoint` is not written
  /// when this throws.
  long MapPoint(int pointIndex, float* inPoint, float* outPoint) const;

 protected:
  Array<CBoneDataClass> bones;
  Array<CPointDataClass> points;
  Geom::Matrix3 initTM;
  bool useSplineAnimation;

 private:
  Geom::Point3 SplineDeformPoint(int pointIndex, int influence, const float* point) const;
};

}  // namespace TessikSDK::Corvane
