#include "geombind/algorithm/heatmap/heatmap_bind.h"

#include <cmath>

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

HeatmapBind::~HeatmapBind() = default;

VertexWeights HeatmapBind::bind(const MeshData&, HierarchyData&, const IBindOptions&, IProgress&) {
  return {};
}

}  // namespace TessikSDK::GeomBind::Algorithm
