#include "geombind/algorithm/geodesic/geodesic_distances.h"

#include <array>
#include <cmath>
#include <deque>

#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

void computeGeodesicDistances(IProgress& progress,
                              SparseVoxelList& voxels,
                              const std::vector<VoxelSet>& boneVoxels,
                              float boundaryCostFactor) {
  if (boneVoxels.empty()) return;
  const std::size_t boneCount = boneVoxels.size();
  std::vector<std::array<float, 3>> centres(voxels.size());
  for (std::size_t i = 0; i < voxels.size(); ++i) {
    SparseVoxel& voxel = *voxels[i];
    voxel.distances.assign(boneCount, kUnreached);
    voxel.index = static_cast<std::uint32_t>(i);
    const glm::dvec3 c = (voxel.octant->bounds.lower + voxel.octant->bounds.upper) * 0.5;
    centres[i] = {static_cast<float>(c.x), static_cast<float>(c.y), static_cast<float>(c.z)};
  }
  progress.begin("Computing Geodesic Distances ... ", static_cast<int>(boneCount), 0);

  const std::int64_t bones = static_cast<std::int64_t>(boneCount);
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t b = 0; b < bones; ++b) {
    const VoxelSet& seeds = boneVoxels[static_cast<std::size_t>(b)];
    if (seeds.empty()) continue;
    // Label-correcting search: a voxel may be queued again whenever a cheaper path reaches it.
    std::deque<SparseVoxel*> queue;
    for (SparseVoxel* seed : seeds) {
      seed->distances[static_cast<std::size_t>(b)] = 0.0f;
      queue.push_back(seed);
    }
    while (!queue.empty()) {
      const SparseVoxel* u = queue.front();
      queue.pop_front();
      const std::array<float, 3>& cu = centres[u->index];
      const float du = u->distances[static_cast<std::size_t>(b)];
      for (SparseVoxel* n : u->neighbours) {
        const std::array<float, 3>& cn = centres[n->index];
        const float dx = cu[0] - cn[0], dy = cu[1] - cn[1], dz = cu[2] - cn[2];
        float step = std::sqrt(dx * dx + dy * dy + dz * dz);
        if (n->label == Boundary) step *= boundaryCostFactor;
        const float candidate = step + du;
        float& current = n->distances[static_cast<std::size_t>(b)];
        if (candidate < current) {
          current = candidate;
          queue.push_back(n);
        }
      }
    }
    progress.update(static_cast<int>(b));
  }
  progress.update(static_cast<int>(boneCount));
  progress.end();
}

}  // namespace TessikSDK::GeomBind::Algorithm
