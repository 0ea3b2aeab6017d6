#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
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

/// Rows of indices stored back to back in one array: row r is indices[offsets[r] .. offsets[r + 1]).
/// Two allocations per table however many rows, so building and freeing one stays cheap at scale.
struct IndexRows {
  /// A row's indices: a view into the table, valid while the table is unchanged.
  class Row {
   public:
    Row(const std::uint32_t* first, const std::uint32_t* last) : first_(first), last_(last) {}
    const std::uint32_t* begin() const { return first_; }
    const std::uint32_t* end() const { return last_; }
    std::size_t size() const { return static_cast<std::size_t>(last_ - first_); }
    bool empty() const { return first_ == last_; }
    std::uint32_t operator[](std::size_t i) const { return first_[i]; }

   private:
    const std::uint32_t* first_;
    const std::uint32_t* last_;
  };

  /// One row per list, in order.
  static IndexRows fromLists(const std::vector<std::vector<std::uint32_t>>& lists);

  /// The number of rows.
  std::size_t size() const { return offsets.empty() ? 0 : offsets.size() - 1; }
  bool empty() const { return size() == 0; }
  /// Row `r`, which must be below size().
  Row operator[](std::size_t r) const {
    return Row(indices.data() + offsets[r], indices.data() + offsets[r + 1]);
  }
  void clear() {
    offsets.clear();
    indices.clear();
  }
  bool operator==(const IndexRows& other) const {
    return size() == other.size() && (empty() || (offsets == other.offsets && indices == other.indices));
  }
  bool operator!=(const IndexRows& other) const { return !(*this == other); }

  /// Empty for a table without rows, else one entry per row plus one, ascending from 0.
  std::vector<std::size_t> offsets;
  std::vector<std::uint32_t> indices;
};

/// The mesh as both binding methods read it: what the host added, plus the tables and the unit-frame
/// normalisation that preparation derives from it.
struct MeshData {
  Collision::AABB boundingBox;
  std::vector<VertexRecord> vertices;
  std::vector<TriangleRecord> triangles;
  /// Every directed edge (a, b) of every triangle in winding order, once, ascending.
  std::vector<DirectedEdge> edges;
  /// Aligned with `edges`: the third vertex of the last triangle that has that directed edge.
  std::vector<std::uint32_t> edgeOpposite;
  /// Per vertex a, plus one: the edges leaving a are edges[edgeStart[a] .. edgeStart[a + 1]).
  std::vector<std::size_t> edgeStart;
  /// Per vertex: the vertices sharing an edge with it, distinct and ascending.
  IndexRows vertexNeighbours;
  /// Per vertex: the triangles using it, distinct and ascending.
  IndexRows vertexTriangles;
  std::array<float, 3> normalizeOffset{0.0f, 0.0f, 0.0f};
  float normalizeScale = 1.0f;

  /// The third vertex of the last triangle with the directed edge (a, b); nothing when no triangle has it
  /// or the tables are not built. A binary search among the few edges leaving `a`.
  std::optional<std::uint32_t> findOpposite(std::uint32_t a, std::uint32_t b) const;
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

  /// Puts back the vertices and box the host added, when a binding has prepared `data` since: preparation
  /// rewrites them in place, and a second binding must start from what the host gave, not from the unit
  /// frame of the first (whose padded box would shift every position again). Triangles are only ever
  /// appended, so `data` keeps the one copy of them.
  void restoreAdded();

  MeshData data;
  /// Set by a binding once it has prepared `data`.
  bool prepared = false;

 private:
  std::vector<VertexRecord> addedVertices_;
  Collision::AABB addedBox_;
};

}  // namespace TessikSDK::GeomBind
