#include "geombind/algorithm/heatmap/heatmap_bind.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include <glm/geometric.hpp>

#include "geombind/algorithm/heatmap/heat_sources.h"
#include "geombind/algorithm/heatmap/heat_system.h"
#include "geombind/algorithm/weight_lists.h"
#include "geombind/collision/occlusion_index.h"

namespace TessikSDK::GeomBind::Algorithm {

void computeVertexNormals(MeshData& mesh) {
  for (VertexRecord& v : mesh.vertices) v.normal = {0.0f, 0.0f, 0.0f};
  for (const TriangleRecord& t : mesh.triangles) {
    const auto& pa = mesh.vertices[t[0]].position;
    const auto& pb = mesh.vertices[t[1]].position;
    const auto& pc = mesh.vertices[t[2]].position;
    const float u[3] = {pb[0] - pa[0], pb[1] - pa[1], pb[2] - pa[2]};
    const float w[3] = {pc[0] - pa[0], pc[1] - pa[1], pc[2] - pa[2]};
    // Not normalised: twice the area, so large triangles weigh more.
    const float n[3] = {u[1] * w[2] - u[2] * w[1], u[2] * w[0] - u[0] * w[2], u[0] * w[1] - u[1] * w[0]};
    for (std::uint32_t v : t)
      for (int k = 0; k < 3; ++k) mesh.vertices[v].normal[k] += n[k];
  }
  for (VertexRecord& v : mesh.vertices) {
    const float lengthSquared =
        v.normal[0] * v.normal[0] + v.normal[1] * v.normal[1] + v.normal[2] * v.normal[2];
    // An isolated vertex (or one whose triangles cancel out) has no direction; 0 * inf would be NaN.
    if (lengthSquared == 0.0f) continue;
    const float inverse = 1.0f / std::sqrt(lengthSquared);
    for (float& c : v.normal) c *= inverse;
  }
}

std::vector<double> triangleAreas(const MeshData& mesh) {
  std::vector<double> areas;
  areas.reserve(mesh.triangles.size());
  for (const TriangleRecord& t : mesh.triangles) {
    const auto& a = mesh.vertices[t[0]].position;
    const auto& b = mesh.vertices[t[1]].position;
    const auto& c = mesh.vertices[t[2]].position;
    const float u[3] = {b[0] - a[0], b[1] - a[1], b[2] - a[2]};
    const float w[3] = {c[0] - a[0], c[1] - a[1], c[2] - a[2]};
    const double cx = double(u[1]) * w[2] - double(u[2]) * w[1];
    const double cy = double(u[2]) * w[0] - double(u[0]) * w[2];
    const double cz = double(u[0]) * w[1] - double(u[1]) * w[0];
    const double squared = cx * cx + cy * cy + cz * cz;
    const double area = 0.5 * std::sqrt(squared);
    // The limit is absolute: the mesh is already in the unit frame.
    if (!(squared > 0.0) || area < 1e-10) return {};
    areas.push_back(area);
  }
  return areas;
}

HeatmapBind::~HeatmapBind() = default;

VertexWeights HeatmapBind::bind(const MeshData& mesh,
                                HierarchyData& hierarchy,
                                const IBindOptions& baseOptions,
                                IProgress& progress) {
  const auto* options = dynamic_cast<const HeatmapOptions*>(&baseOptions);
  if (options == nullptr) return {};
  if (hierarchy.nodeCount() == 0 || mesh.vertices.empty() || mesh.triangles.empty()) return {};
  const std::vector<double> areas = triangleAreas(mesh);
  if (areas.empty()) return {};

  progress.begin("Computing Heatmap weights ... ", 6, 0);
  progress.update(0);
  Collision::OcclusionIndex triangles;
  bool indexed = false;
  if (!progress.isCanceled()) {
    std::vector<Collision::Triangle> list;
    list.reserve(mesh.triangles.size());
    for (const TriangleRecord& t : mesh.triangles) list.push_back(triangleOf(mesh, t));
    // Sight is decided by the triangles that share a depth-10 octree leaf with the segment; the index
    // answers that without building the octree, whose size follows the surface area in leaf cells.
    triangles = Collision::OcclusionIndex(mesh.boundingBox, std::move(list), kOcclusionDepth);
    indexed = true;
  }

  progress.update(1);
  HeatSources sources;
  if (!progress.isCanceled()) sources = collectHeatSources(hierarchy);
  // A twentieth of the half diagonal of the padded mesh box: enough to leave the surface, small next to a
  // limb.
  const glm::dvec3 halfDiagonal =
      indexed ? (triangles.bounds().upper - triangles.bounds().lower) * 0.5 : glm::dvec3(0.0);
  const auto pushDistance =
      static_cast<float>(static_cast<double>(0.05f) * std::sqrt(glm::dot(halfDiagonal, halfDiagonal)));
  pushBonesOffVertices(mesh, hierarchy, pushDistance);
  SourceVisibility visibility;
  if (!progress.isCanceled()) {
    visibility = computeSourceVisibility(
        mesh, hierarchy, [&triangles](const Collision::Segment& s) { return triangles.blocked(s); }, sources,
        static_cast<double>(options->falloff), pushDistance);
  }
  // A host's progress display is closed on every way out once it was opened.
  if (!visibility.anyVisible) {
    progress.end();
    return {};
  }

  progress.update(2);
  VertexWeights weights;
  if (!progress.isCanceled() && !solveHeat(mesh, areas, visibility, weights)) {
    progress.end();
    return {};
  }

  progress.update(3);
  if (progress.isCanceled()) {
    // Lists still indexed by heat source must never be handed out as bone weights.
    progress.end();
    return {};
  }
  const std::size_t tips = sources.tipJoints.size();
  std::vector<BoneWeight> byBone;
  for (std::vector<BoneWeight>& list : weights) {
    // A handful of sources per vertex: a short list, summed in the sources' order, beats a map.
    byBone.clear();
    for (const BoneWeight& w : list) {
      const std::uint32_t bone = w.boneIndex < tips ? sources.tipJoints[w.boneIndex]
                                                    : sources.boneSegments[w.boneIndex - tips].first;
      auto same = std::find_if(byBone.begin(), byBone.end(),
                               [bone](const BoneWeight& b) { return b.boneIndex == bone; });
      if (same == byBone.end()) {
        byBone.push_back(BoneWeight{bone, w.weight});
      } else {
        same->weight += w.weight;
      }
    }
    std::sort(byBone.begin(), byBone.end(),
              [](const BoneWeight& a, const BoneWeight& b) { return a.boneIndex < b.boneIndex; });
    list.assign(byBone.begin(), byBone.end());
    normalizeWeights(list);
  }

  progress.update(4);
  if (!progress.isCanceled()) truncateWeights(options->influenceLimit, weights);
  progress.update(5);
  if (!progress.isCanceled()) normalizeAllWeights(weights);
  progress.end();
  return weights;
}

}  // namespace TessikSDK::GeomBind::Algorithm
