#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"

#include <algorithm>
#include <array>

namespace TessikSDK::GeomBind::Algorithm {

std::int32_t ceilLog2(std::int32_t n) {
  if (n <= 1) return 0;
  std::uint32_t v = static_cast<std::uint32_t>(n - 1);
  std::int32_t bits = 0;
  while (v != 0) {
    ++bits;
    v >>= 1;
  }
  return bits;
}

std::int32_t smoothingIterationsFor(std::int32_t resolution) {
  static constexpr std::array<std::int32_t, 5> kPasses = {4, 4, 3, 2, 2};
  const std::int32_t index = std::max(ceilLog2(resolution) - 6, 0);
  return kPasses[static_cast<std::size_t>(std::min<std::int32_t>(index, kPasses.size() - 1))];
}

GeodesicSparseVoxelBind::~GeodesicSparseVoxelBind() = default;

VertexWeights GeodesicSparseVoxelBind::bind(const MeshData&,
                                            HierarchyData&,
                                            const IBindOptions&,
                                            IProgress&) {
  return {};
}

}  // namespace TessikSDK::GeomBind::Algorithm
