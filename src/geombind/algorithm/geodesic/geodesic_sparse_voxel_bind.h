#pragma once

#include <cstdint>

#include "geombind/algorithm/bind_strategy.h"
#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/collision/octree.h"

namespace TessikSDK::GeomBind::Algorithm {

/// Bit length of n - 1 for n > 1, else 0: the octree depth that reaches n cells per axis.
std::int32_t ceilLog2(std::int32_t n);

/// Smoothing passes for a voxel resolution: 4 up to 128, 3 up to 256, 2 beyond (resolutions above
/// 1024 use the last entry).
std::int32_t smoothingIterationsFor(std::int32_t resolution);

struct GeodesicSparseVoxelOptions : IBindOptions {
  std::int32_t resolution = 0;
  std::int32_t influenceLimit = 0;  ///< 0 or less keeps every influence
  float falloff = 0.0f;             ///< in [0, 1]
  bool refineInterior = false;
  float lowFalloffExponent = 5.0f;
  float highFalloffExponent = 30.0f;
  float boundaryCostFactor = 4.0f;
  std::int32_t smoothingIterations = 4;
  InteriorVoxelizer voxelizer = InteriorVoxelizer::gpu;
};

/// Stage "Compute Octree": the mesh triangles and the bone elements (segments parent to child, points at
/// joints without children) split down to depth ceilLog2(resolution) over octreeBox(), so that its
/// finest octants are the cells of the finest grid. Left unbuilt when cancelled.
void computeOctree(IProgress& progress,
                   const MeshData& mesh,
                   const HierarchyData& hierarchy,
                   std::int32_t resolution,
                   Collision::Octree& octree);

/// Weight exponent for a falloff in [0, 1], in single precision: 5 at 0, 17.5 at 0.5, 30 at 1.
double weightExponent(const GeodesicSparseVoxelOptions& options);

/// Geodesic sparse-voxel binding: the mesh volume is voxelised (surface on the CPU, interior as
/// `voxelizer` says: on the GPU through the current OpenGL context, or on the CPU), distances from every bone
/// run through the voxels, and weights fall off with a power of them, smoothed over the mesh and truncated to
/// `influenceLimit`.
///
/// Result: one list per vertex. Lists of `influenceLimit` or fewer bones (or every list when the limit
/// is below 1) hold every bone in bone order; longer ones are cut to the strongest, sorted by weight,
/// largest first, ties by ascending bone index. Weights sum to 1 unless no bone reaches the vertex (all
/// 0). A vertex outside every voxel has an empty list. Resolutions of 1 or less, options of another
/// method, or a cancelled run give an empty result. Prints the stage timing table to stdout. Not
/// reentrant: the stage timers are process-wide. Deterministic for any thread count.
class GeodesicSparseVoxelBind : public IBindStrategy {
 public:
  ~GeodesicSparseVoxelBind() override;
  VertexWeights bind(const MeshData& mesh,
                     HierarchyData& hierarchy,
                     const IBindOptions& options,
                     IProgress& progress) override;
};

}  // namespace TessikSDK::GeomBind::Algorithm
