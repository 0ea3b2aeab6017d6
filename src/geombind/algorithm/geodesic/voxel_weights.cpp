#include "geombind/algorithm/geodesic/voxel_weights.h"

#include <cmath>

#include <glm/geometric.hpp>

#include "geombind/algorithm/geodesic/geodesic_distances.h"
#include "geombind/algorithm/weight_lists.h"
#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

VertexWeights computeWeights(const Collision::Octree& octree,
                             const MeshData& mesh,
                             const VoxelMap& voxelMap,
                             std::uint32_t boneCount,
                             double exponent) {
  VertexWeights weights;
  if (octree.allElements().empty() || octree.children().empty()) return weights;
  weights.resize(mesh.vertices.size());
  const std::int64_t count = static_cast<std::int64_t>(mesh.vertices.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    const auto& position = mesh.vertices[static_cast<std::size_t>(i)].position;
    const glm::dvec3 p(position[0], position[1], position[2]);
    const VoxelSet containing = voxelsTouching(octree, voxelMap, p);
    if (containing.empty()) continue;
    const SparseVoxel& voxel = **containing.begin();  // lowest list position on shared faces
    const glm::dvec3 centre = (voxel.octant->bounds.lower + voxel.octant->bounds.upper) * 0.5;
    const double toCentre = glm::length(centre - p);
    std::vector<BoneWeight>& list = weights[static_cast<std::size_t>(i)];
    list.resize(boneCount);
    bool anyInfinite = false;
    for (std::uint32_t b = 0; b < boneCount; ++b) {
      // Distances are missing when their stage was skipped (a progress object that cancelled only then).
      const float d = b < voxel.distances.size() ? voxel.distances[b] : kUnreached;
      // No path reached this voxel from the bone. In double precision (largest float)^5 does not overflow,
      // so the power alone would leave a tiny weight; an unreached bone weighs nothing.
      const double raw = d >= kUnreached ? 0.0 : 1.0 / std::pow(static_cast<double>(d) + toCentre, exponent);
      list[b] = BoneWeight{b, raw};
      anyInfinite = anyInfinite || std::isinf(raw);
    }
    // A total distance of 0 (or one so small its power underflows) would divide infinity by infinity:
    // the bones that close share the vertex instead.
    if (anyInfinite) {
      for (BoneWeight& w : list) w.weight = std::isinf(w.weight) ? 1.0 : 0.0;
    }
    normalizeWeights(list);
  }
  return weights;
}

void smoothWeights(
    VertexWeights& weights, const MeshData& mesh, std::uint32_t boneCount, std::int32_t passes, float blend) {
  if (mesh.vertices.empty() || passes <= 0) return;
  // Weights may be shorter than the mesh (an unbuilt octree gives none at all).
  const std::size_t listCount = weights.size();
  VertexWeights target = weights;
  const double f = blend;
  auto entry = [&](std::size_t vertex, std::uint32_t bone) {
    if (vertex >= listCount) return 0.0;
    const std::vector<BoneWeight>& list = weights[vertex];
    return bone < list.size() ? list[bone].weight : 0.0;
  };
  const std::int64_t count = static_cast<std::int64_t>(std::min(listCount, mesh.vertexNeighbours.size()));
  for (std::int32_t pass = 0; pass < passes; ++pass) {
#pragma omp parallel for schedule(static) num_threads(processorThreads())
    for (std::int64_t v = 0; v < count; ++v) {
      const auto i = static_cast<std::size_t>(v);
      const IndexRows::Row neighbours = mesh.vertexNeighbours[i];
      std::vector<BoneWeight>& out = target[i];
      if (neighbours.empty() || out.empty()) continue;
      const auto& pi = mesh.vertices[i].position;
      std::vector<float> w(neighbours.size());
      float total = 0.0f;
      for (std::size_t j = 0; j < neighbours.size(); ++j) {
        const auto& pj = mesh.vertices[neighbours[j]].position;
        const float dx = pj[0] - pi[0], dy = pj[1] - pi[1], dz = pj[2] - pi[2];
        w[j] = std::sqrt(dx * dx + dy * dy + dz * dz);
        total += w[j];
      }
      const float m = static_cast<float>(neighbours.size());
      for (float& wj : w) wj = total > 0.0f ? 1.0f - wj / total : 1.0f - 1.0f / m;
      const std::uint32_t bones = std::min<std::uint32_t>(boneCount, static_cast<std::uint32_t>(out.size()));
      for (std::uint32_t b = 0; b < bones; ++b) {
        double a = 0.0;
        for (std::size_t j = 0; j < neighbours.size(); ++j)
          a += static_cast<double>(w[j]) * entry(neighbours[j], b);
        a /= static_cast<double>(neighbours.size());
        const double o = entry(i, b);
        out[b].weight = (a - o) * f + o;
      }
    }
    weights = target;
  }
  normalizeAllWeights(weights);
}

}  // namespace TessikSDK::GeomBind::Algorithm
