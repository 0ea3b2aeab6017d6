#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <utility>
#include <vector>

#include "tessik/geombind.h"

#include "geombind/collision/primitives.h"

namespace TessikSDK::GeomBind {

struct VertexRecord {
  std::array<float, 3> normal{0.0f, 0.0f, 0.0f};
  std::array<float, 3> position{0.0f, 0.0f, 0.0f};
};

using TriangleRecord = std::array<std::uint32_t, 3>;
using DirectedEdge = std::pair<std::uint32_t, std::uint32_t>;

/// The mesh as both binding methods read it: what the host added, plus the tables and the unit-frame
/// normalisation that preparation derives from it.
struct MeshData {
  Collision::AABB boundingBox;
  std::vector<VertexRecord> vertices;
  std::vector<TriangleRecord> triangles;
  /// Every directed edge (a, b) of every triangle in winding order, once, ascending.
  std::vector<DirectedEdge> edges;
  /// For a directed edge, the third vertex of the (last) triangle that has it.
  std::map<DirectedEdge, std::uint32_t> edgeOpposite;
  /// Per vertex: the vertices sharing an edge with it, distinct and ascending.
  std::vector<std::vector<std::uint32_t>> vertexNeighbours;
  /// Per vertex: the triangles using it, distinct and ascending.
  std::vector<std::vector<std::uint32_t>> vertexTriangles;
  std::array<float, 3> normalizeOffset{0.0f, 0.0f, 0.0f};
  float normalizeScale = 1.0f;
};

/// The triangle's corners widened to double, in its winding order: what the spatial queries work on.
inline Collision::Triangle triangleOf(const MeshData& mesh, const TriangleRecord& t) {
  auto corner = [&](int k) {
    const auto& p = mesh.vertices[t[k]].position;
    return glm::dvec3(p[0], p[1], p[2]);
  };
  return Collision::Triangle(corner(0), corner(1), corner(2));
}

class MeshImpl : public IMesh {
 public:
  void addVertex(float x, float y, float z) override;
  void addTriangle(unsigned int a, unsigned int b, unsigned int c) override;
  ~MeshImpl() override;

  /// Puts back the vertices, triangles and box the host added, when a binding has prepared `data` since:
  /// preparation rewrites them in place, and a second binding must start from what the host gave, not
  /// from the unit frame of the first (whose padded box would shift every position again).
  void restoreAdded();

  MeshData data;
  /// Set by a binding once it has prepared `data`.
  bool prepared = false;

 private:
  std::vector<VertexRecord> addedVertices_;
  std::vector<TriangleRecord> addedTriangles_;
  Collision::AABB addedBox_;
};

}  // namespace TessikSDK::GeomBind
