#pragma once

#include <array>

#include "geombind/mesh.h"
#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind {

/// Whether a binding can run on this mesh without reading outside its tables or dividing by a zero
/// extent: every triangle names existing vertices, every coordinate is finite, and the vertices do not
/// all coincide. An empty mesh passes (the methods answer it with an empty result themselves).
bool isBindable(const MeshData& mesh);

/// (p - normalizeOffset) * normalizeScale, per component in single precision.
std::array<float, 3> normalizePoint(const MeshData& mesh, const std::array<float, 3>& p);

/// Moves and scales the mesh so its box starts at the origin and its longest side is 1.
void normalizeMesh(MeshData& mesh);

/// Rebuilds edges, edgeOpposite, edgeStart, vertexNeighbours and vertexTriangles from the triangles, in
/// time linear in the vertex and triangle counts. A mesh without vertices or triangles keeps its tables.
void buildTopology(MeshData& mesh);

/// Which method a preparation is for: the geodesic method voxelises a fixed cube around the unit frame.
enum class PreparationMode { heatmap, geodesic };

/// The preparation both methods share: unit frame, adjacency tables, and every node reduced to its
/// joint position in the unit frame. In geodesic mode the box becomes a cube just larger than the unit
/// cube. Changes mesh and hierarchy in place; call isBindable first.
void prepareForBinding(MeshData& mesh, HierarchyData& hierarchy, PreparationMode mode);

}  // namespace TessikSDK::GeomBind
