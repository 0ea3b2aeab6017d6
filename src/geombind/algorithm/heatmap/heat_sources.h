#pragma once

#include <cstdint>
#include <functional>
#include <utility>
#include <vector>

#include "geombind/collision/primitives.h"
#include "geombind/mesh.h"
#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind::Algorithm {

/// The targets of the diffusion: first every tip joint (a bone no bone names as parent), then every
/// bone segment (parent, child). Source t < tipJoints.size() is tip t; the rest are segments.
struct HeatSources {
  std::vector<std::uint32_t> tipJoints;
  std::vector<std::pair<std::uint32_t, std::uint32_t>> boneSegments;
  std::size_t count() const { return tipJoints.size() + boneSegments.size(); }
};

HeatSources collectHeatSources(const HierarchyData& hierarchy);

/// (1 - falloff) d + falloff d^2: 0 ranks sources by distance, 1 by squared distance.
double distanceMeasure(double d, double falloff);

/// Per vertex and source: the distance measure, and whether the source is one of the vertex's nearest
/// (within 0.01 % of the measure) and can be seen from it.
struct SourceVisibility {
  std::size_t sourceCount = 0;
  std::vector<double> distances;      ///< vertex-major, vertices x sources
  std::vector<std::uint8_t> visible;  ///< same layout, 1 = seen
  bool anyVisible = false;

  double distance(std::size_t vertex, std::size_t source) const {
    return distances[vertex * sourceCount + source];
  }
  bool isVisible(std::size_t vertex, std::size_t source) const {
    return visible[vertex * sourceCount + source] != 0;
  }
};

/// Whether the mesh hides a source point from a vertex: the segment runs from the vertex to the point.
/// Called from several threads at once.
using SightBlocked = std::function<bool(const Collision::Segment&)>;

/// Fills every distance and decides visibility of each vertex's nearest sources: the vertex normal must
/// face away from the source point by less than 60 degrees, and `blocked` must not hide the point. A
/// source point on the vertex itself is pushed `pushDistance` inside along the normal; a vertex without a
/// normal sees nothing there. Parallel over vertices.
SourceVisibility computeSourceVisibility(const MeshData& mesh,
                                         const HierarchyData& hierarchy,
                                         const SightBlocked& blocked,
                                         const HeatSources& sources,
                                         double falloff,
                                         float pushDistance);

/// Moves every bone that sits exactly on a mesh vertex by -pushDistance along that vertex's normal, in
/// the hierarchy itself.
void pushBonesOffVertices(const MeshData& mesh, HierarchyData& hierarchy, float pushDistance);

}  // namespace TessikSDK::GeomBind::Algorithm
