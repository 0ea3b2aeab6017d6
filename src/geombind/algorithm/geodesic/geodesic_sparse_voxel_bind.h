#pragma once

#include <cstdint>

#include "geombind/algorithm/bind_strategy.h"

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
};

/// Geodesic sparse-voxel binding. Not available yet in this build: bind returns an empty list.
class GeodesicSparseVoxelBind : public IBindStrategy {
 public:
  ~GeodesicSparseVoxelBind() override;
  VertexWeights bind(const MeshData& mesh,
                     HierarchyData& hierarchy,
                     const IBindOptions& options,
                     IProgress& progress) override;
};

}  // namespace TessikSDK::GeomBind::Algorithm
