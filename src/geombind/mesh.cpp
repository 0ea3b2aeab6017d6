#include "geombind/mesh.h"

#include <algorithm>

namespace TessikSDK::GeomBind {

IndexRows IndexRows::fromLists(const std::vector<std::vector<std::uint32_t>>& lists) {
  IndexRows rows;
  rows.offsets.reserve(lists.size() + 1);
  rows.offsets.push_back(0);
  for (const std::vector<std::uint32_t>& list : lists) {
    rows.indices.insert(rows.indices.end(), list.begin(), list.end());
    rows.offsets.push_back(rows.indices.size());
  }
  return rows;
}

std::optional<std::uint32_t> MeshData::findOpposite(std::uint32_t a, std::uint32_t b) const {
  if (std::size_t{a} + 1 >= edgeStart.size()) return std::nullopt;
  const auto first = edges.begin() + static_cast<std::ptrdiff_t>(edgeStart[a]);
  const auto last = edges.begin() + static_cast<std::ptrdiff_t>(edgeStart[a + 1]);
  const auto found = std::lower_bound(first, last, DirectedEdge{a, b});
  if (found == last || found->second != b) return std::nullopt;
  return edgeOpposite[static_cast<std::size_t>(found - edges.begin())];
}

IMesh::~IMesh() = default;

IMesh* IMesh::create() { return new MeshImpl(); }

void IMesh::dispose(IMesh* mesh) { delete mesh; }

MeshImpl::~MeshImpl() = default;

void MeshImpl::addVertex(float x, float y, float z) {
  data.boundingBox.extend(glm::dvec3(x, y, z));
  VertexRecord vertex;
  vertex.position = {x, y, z};
  data.vertices.push_back(vertex);
  addedBox_.extend(glm::dvec3(x, y, z));
  addedVertices_.push_back(vertex);
}

void MeshImpl::addTriangle(unsigned int a, unsigned int b, unsigned int c) {
  data.triangles.push_back({a, b, c});
}

void MeshImpl::restoreAdded() {
  if (!prepared) return;
  data.vertices = addedVertices_;
  data.boundingBox = addedBox_;
  data.normalizeOffset = {0.0f, 0.0f, 0.0f};
  data.normalizeScale = 1.0f;
  prepared = false;
}

}  // namespace TessikSDK::GeomBind
