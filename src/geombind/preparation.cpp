#include "geombind/preparation.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace TessikSDK::GeomBind {

namespace {

// Stable: records with equal keys keep their order. Keys must be below `keyCount`.
template <class Record, class Key>
void countingSort(const std::vector<Record>& in, std::vector<Record>& out, std::size_t keyCount, Key key) {
  std::vector<std::size_t> next(keyCount + 1, 0);
  for (const Record& r : in) ++next[std::size_t{key(r)} + 1];
  for (std::size_t k = 0; k < keyCount; ++k) next[k + 1] += next[k];
  out.resize(in.size());
  for (const Record& r : in) out[next[key(r)]++] = r;
}

// Every corner of every triangle is one directed edge with its opposite vertex, listed in triangle
// order. Two stable counting sorts, by b and then by a, order them by edge while keeping that order
// among copies of one edge, so the last copy of each run is the last triangle's: linear time, where
// ordered sets per vertex cost a tree node for every insertion.
void buildDirectedEdges(MeshData& mesh, std::size_t vertexCount) {
  struct Corner {
    std::uint32_t a, b, c;
  };
  std::vector<Corner> corners;
  corners.reserve(3 * mesh.triangles.size());
  for (const TriangleRecord& t : mesh.triangles) {
    for (int i = 0; i < 3; ++i) corners.push_back({t[i], t[(i + 1) % 3], t[(i + 2) % 3]});
  }
  std::vector<Corner> byB;
  countingSort(corners, byB, vertexCount, [](const Corner& e) { return e.b; });
  countingSort(byB, corners, vertexCount, [](const Corner& e) { return e.a; });

  // A closed manifold has every corner's edge once: the count is exact there and an upper bound anywhere.
  mesh.edges.clear();
  mesh.edges.reserve(corners.size());
  mesh.edgeOpposite.clear();
  mesh.edgeOpposite.reserve(corners.size());
  mesh.edgeStart.assign(vertexCount + 1, 0);
  for (std::size_t i = 0; i < corners.size(); ++i) {
    const Corner& e = corners[i];
    if (i + 1 < corners.size() && corners[i + 1].a == e.a && corners[i + 1].b == e.b) continue;
    mesh.edges.emplace_back(e.a, e.b);
    mesh.edgeOpposite.push_back(e.c);
    ++mesh.edgeStart[std::size_t{e.a} + 1];
  }
  for (std::size_t v = 0; v < vertexCount; ++v) mesh.edgeStart[v + 1] += mesh.edgeStart[v];
}

// A vertex's neighbours are the union of two sorted rows: the ends of the edges leaving it (from the edge
// table) and the starts of those arriving at it.
IndexRows neighbourRows(const MeshData& mesh, std::size_t vertexCount) {
  const std::vector<DirectedEdge>& edges = mesh.edges;
  const std::vector<std::size_t>& outStart = mesh.edgeStart;
  // Filled from the ascending edge list, each arriving row comes out ascending.
  std::vector<std::size_t> inStart(vertexCount + 1, 0);
  for (const DirectedEdge& e : edges) ++inStart[std::size_t{e.second} + 1];
  for (std::size_t v = 0; v < vertexCount; ++v) inStart[v + 1] += inStart[v];
  std::vector<std::uint32_t> inFrom(edges.size());
  {
    std::vector<std::size_t> next(inStart.begin(), inStart.end() - 1);
    for (const DirectedEdge& e : edges) inFrom[next[e.second]++] = e.first;
  }

  // Each row is written where its bound (out + in) starts, then the table is closed up in place: a row
  // never moves right, since no row is longer than its bound.
  IndexRows rows;
  rows.indices.resize(2 * edges.size());
  rows.offsets.assign(vertexCount + 1, 0);
  std::vector<std::size_t> lengths(vertexCount);
  for (std::size_t v = 0; v < vertexCount; ++v) {
    std::uint32_t* const first = rows.indices.data() + outStart[v] + inStart[v];
    std::uint32_t* last = first;
    std::size_t i = outStart[v], j = inStart[v];
    const std::size_t outEnd = outStart[v + 1], inEnd = inStart[v + 1];
    while (i < outEnd || j < inEnd) {
      if (j == inEnd || (i < outEnd && edges[i].second <= inFrom[j])) {
        if (j < inEnd && inFrom[j] == edges[i].second) ++j;
        *last++ = edges[i++].second;
      } else {
        *last++ = inFrom[j++];
      }
    }
    lengths[v] = static_cast<std::size_t>(last - first);
  }
  for (std::size_t v = 0; v < vertexCount; ++v) {
    const std::size_t from = outStart[v] + inStart[v], to = rows.offsets[v];
    if (from != to && lengths[v] != 0) {
      std::memmove(rows.indices.data() + to, rows.indices.data() + from, lengths[v] * sizeof(std::uint32_t));
    }
    rows.offsets[v + 1] = to + lengths[v];
  }
  rows.indices.resize(rows.offsets[vertexCount]);
  rows.indices.shrink_to_fit();
  return rows;
}

// Triangles are visited in index order, so each vertex's row comes out ascending; a corner that repeats
// an earlier one of its triangle adds nothing.
IndexRows incidentTriangleRows(const std::vector<TriangleRecord>& triangles, std::size_t vertexCount) {
  auto forEachDistinctCorner = [&triangles](auto&& visit) {
    for (std::uint32_t t = 0; t < triangles.size(); ++t) {
      const TriangleRecord& tri = triangles[t];
      visit(tri[0], t);
      if (tri[1] != tri[0]) visit(tri[1], t);
      if (tri[2] != tri[0] && tri[2] != tri[1]) visit(tri[2], t);
    }
  };
  IndexRows rows;
  rows.offsets.assign(vertexCount + 1, 0);
  forEachDistinctCorner([&](std::uint32_t v, std::uint32_t) { ++rows.offsets[std::size_t{v} + 1]; });
  for (std::size_t v = 0; v < vertexCount; ++v) rows.offsets[v + 1] += rows.offsets[v];
  rows.indices.resize(rows.offsets[vertexCount]);
  std::vector<std::size_t> next(rows.offsets.begin(), rows.offsets.end() - 1);
  forEachDistinctCorner([&](std::uint32_t v, std::uint32_t t) { rows.indices[next[v]++] = t; });
  return rows;
}

}  // namespace

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
  const std::size_t vertexCount = mesh.vertices.size();
  buildDirectedEdges(mesh, vertexCount);
  mesh.vertexNeighbours = neighbourRows(mesh, vertexCount);
  mesh.vertexTriangles = incidentTriangleRows(mesh.triangles, vertexCount);
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
