#include "geombind/preparation.h"

#include <algorithm>
#include <cmath>
#include <set>

namespace TessikSDK::GeomBind {

bool isBindable(const MeshData& mesh) {
  const std::size_t count = mesh.vertices.size();
  for (const TriangleRecord& t : mesh.triangles) {
    if (t[0] >= count || t[1] >= count || t[2] >= count) return false;
  }
  for (const VertexRecord& v : mesh.vertices) {
    if (!std::isfinite(v.position[0]) || !std::isfinite(v.position[1]) || !std::isfinite(v.position[2])) {
      return false;
    }
  }
  if (count == 0) return true;
  // The box, not the positions, sets the scale; it must give a finite, non-zero one.
  const glm::dvec3 sides = mesh.boundingBox.upper - mesh.boundingBox.lower;
  const double extent = std::max({sides.x, sides.y, sides.z});
  return std::isfinite(extent) && extent > 0.0 && std::isfinite(static_cast<float>(1.0 / extent));
}

std::array<float, 3> normalizePoint(const MeshData& mesh, const std::array<float, 3>& p) {
  std::array<float, 3> q;
  for (int k = 0; k < 3; ++k) q[k] = (p[k] - mesh.normalizeOffset[k]) * mesh.normalizeScale;
  return q;
}

void normalizeMesh(MeshData& mesh) {
  if (mesh.vertices.empty()) return;
  Collision::AABB& box = mesh.boundingBox;
  const glm::dvec3 sides = box.upper - box.lower;
  const double extent = std::max({sides.x, sides.y, sides.z});
  for (int k = 0; k < 3; ++k) mesh.normalizeOffset[k] = static_cast<float>(box.lower[k]);
  mesh.normalizeScale = static_cast<float>(1.0 / extent);
  for (VertexRecord& v : mesh.vertices) v.position = normalizePoint(mesh, v.position);
  const std::array<float, 3> upper = normalizePoint(
      mesh,
      {static_cast<float>(box.upper.x), static_cast<float>(box.upper.y), static_cast<float>(box.upper.z)});
  box.lower = glm::dvec3(0.0);
  box.upper = glm::dvec3(upper[0], upper[1], upper[2]);
}

void buildTopology(MeshData& mesh) {
  if (mesh.vertices.empty() || mesh.triangles.empty()) return;
  mesh.edges.clear();
  mesh.edgeOpposite.clear();
  mesh.vertexNeighbours.clear();
  mesh.vertexTriangles.clear();

  std::vector<std::set<std::uint32_t>> neighbours(mesh.vertices.size());
  std::vector<std::set<std::uint32_t>> incident(mesh.vertices.size());
  std::set<DirectedEdge> edges;
  for (std::uint32_t t = 0; t < mesh.triangles.size(); ++t) {
    const TriangleRecord& tri = mesh.triangles[t];
    for (int i = 0; i < 3; ++i) {
      const std::uint32_t a = tri[i], b = tri[(i + 1) % 3], c = tri[(i + 2) % 3];
      neighbours[a].insert(b);
      neighbours[b].insert(a);
      edges.insert({a, b});
      mesh.edgeOpposite[{a, b}] = c;  // the last triangle with this directed edge wins
    }
    for (std::uint32_t v : tri) incident[v].insert(t);
  }
  mesh.vertexNeighbours.reserve(neighbours.size());
  mesh.vertexTriangles.reserve(incident.size());
  for (std::size_t v = 0; v < neighbours.size(); ++v) {
    mesh.vertexNeighbours.emplace_back(neighbours[v].begin(), neighbours[v].end());
    mesh.vertexTriangles.emplace_back(incident[v].begin(), incident[v].end());
  }
  mesh.edges.assign(edges.begin(), edges.end());
}

void prepareForBinding(MeshData& mesh, HierarchyData& hierarchy, PreparationMode mode) {
  normalizeMesh(mesh);
  buildTopology(mesh);
  if (mode == PreparationMode::geodesic) {
    // A margin around the unit cube keeps surface voxels off the grid's outer faces.
    mesh.boundingBox = Collision::AABB(glm::dvec3(-0.00001), glm::dvec3(1.00001));
  }
  for (Matrix4& m : hierarchy.transforms) {
    const std::array<float, 3> joint = normalizePoint(
        mesh, {static_cast<float>(m[12]), static_cast<float>(m[13]), static_cast<float>(m[14])});
    m = Matrix4{1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, joint[0], joint[1], joint[2], 1};
  }
}

}  // namespace TessikSDK::GeomBind
