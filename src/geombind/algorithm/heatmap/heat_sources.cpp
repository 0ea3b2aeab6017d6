#include "geombind/algorithm/heatmap/heat_sources.h"

#include <atomic>
#include <limits>

#include <glm/geometric.hpp>

#include "geombind/collision/intersection.h"
#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

namespace {

glm::dvec3 bonePosition(const HierarchyData& hierarchy, std::uint32_t bone) {
  const Matrix4& m = hierarchy.transforms[bone];
  return {m[12], m[13], m[14]};
}

}  // namespace

HeatSources collectHeatSources(const HierarchyData& hierarchy) {
  HeatSources sources;
  const std::uint32_t count = hierarchy.nodeCount();
  std::vector<bool> hasChild(count, false);
  for (std::uint32_t i = 0; i < count; ++i) {
    const std::int32_t parent = hierarchy.parentIndex(i);
    if (parent == -1) continue;
    sources.boneSegments.emplace_back(static_cast<std::uint32_t>(parent), i);
    hasChild[static_cast<std::size_t>(parent)] = true;
  }
  for (std::uint32_t i = 0; i < count; ++i) {
    if (!hasChild[i]) sources.tipJoints.push_back(i);
  }
  return sources;
}

double distanceMeasure(double d, double falloff) { return (d * d - d) * falloff + d; }

SourceVisibility computeSourceVisibility(const MeshData& mesh,
                                         const HierarchyData& hierarchy,
                                         const SightBlocked& blocked,
                                         const HeatSources& sources,
                                         double falloff,
                                         float pushDistance) {
  SourceVisibility result;
  const std::size_t sourceCount = sources.count();
  const std::size_t vertexCount = mesh.vertices.size();
  result.sourceCount = sourceCount;
  result.distances.assign(vertexCount * sourceCount, -1.0);
  result.visible.assign(vertexCount * sourceCount, 0);
  const std::size_t tips = sources.tipJoints.size();
  std::atomic<bool> anyVisible(false);

  const std::int64_t count = static_cast<std::int64_t>(vertexCount);
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t vi = 0; vi < count; ++vi) {
    const auto v = static_cast<std::size_t>(vi);
    const auto& position = mesh.vertices[v].position;
    const auto& normal = mesh.vertices[v].normal;
    const glm::dvec3 p(position[0], position[1], position[2]);
    const glm::dvec3 n(normal[0], normal[1], normal[2]);
    double* distances = &result.distances[v * sourceCount];
    double nearest = std::numeric_limits<double>::max();
    for (std::size_t e = 0; e < sourceCount; ++e) {
      double d;
      if (e < tips) {
        d = glm::length(p - bonePosition(hierarchy, sources.tipJoints[e]));
      } else {
        const auto& [a, b] = sources.boneSegments[e - tips];
        d = Collision::distance(p,
                                Collision::Segment(bonePosition(hierarchy, a), bonePosition(hierarchy, b)));
      }
      distances[e] = distanceMeasure(d, falloff);
      if (distances[e] < nearest) nearest = distances[e];
    }
    const double threshold = nearest * 1.0001;
    for (std::size_t e = 0; e < sourceCount; ++e) {
      if (distances[e] > threshold) continue;
      glm::dvec3 q;
      if (e < tips) {
        q = bonePosition(hierarchy, sources.tipJoints[e]);
      } else {
        const auto& [a, b] = sources.boneSegments[e - tips];
        // Coincident joints give the joint itself.
        q = Collision::closestPoint(
            p, Collision::Segment(bonePosition(hierarchy, a), bonePosition(hierarchy, b)));
      }
      if (q == p) q -= static_cast<double>(pushDistance) * n;
      const glm::dvec3 toVertex = p - q;
      const double length = glm::length(toVertex);
      // A source still on the vertex (no normal to push along) has no direction to be seen from.
      if (!(length > 0.0)) continue;
      if (!(glm::dot(toVertex / length, n) > 0.5)) continue;
      if (blocked(Collision::Segment(p, q))) continue;
      result.visible[v * sourceCount + e] = 1;
      anyVisible.store(true, std::memory_order_relaxed);
    }
  }
  result.anyVisible = anyVisible.load();
  return result;
}

void pushBonesOffVertices(const MeshData& mesh, HierarchyData& hierarchy, float pushDistance) {
  for (Matrix4& m : hierarchy.transforms) {
    for (const VertexRecord& v : mesh.vertices) {
      const glm::dvec3 p(v.position[0], v.position[1], v.position[2]);
      if (p.x != m[12] || p.y != m[13] || p.z != m[14]) continue;
      // Later vertices are compared with the moved position.
      for (int k = 0; k < 3; ++k) m[12 + k] -= static_cast<double>(pushDistance) * v.normal[k];
    }
  }
}

}  // namespace TessikSDK::GeomBind::Algorithm
