#pragma once

#include <cstdint>
#include <vector>

#include "tessik/pipeline.h"

namespace TessikSDK::Pipeline {

struct WeldedMesh {
  Mesh mesh;                          // positions and triangles only; triangles that collapsed are dropped
  std::vector<std::uint32_t> weldOf;  // for each input vertex, the welded vertex it became
};

// Joins vertices that lie within `tolerance` of each other (in every coordinate), keeping the first one
// met of each group. Importers split vertices along UV and normal seams; binding the split surface would
// see each seam as a cut and could weight its two sides differently.
WeldedMesh weldByPosition(const Mesh& mesh, float tolerance);

// Removes the triangles whose area is below a ten-billionth of the square of the mesh's largest side:
// the heat method refuses a surface holding one, and they add nothing to its shape. Answers how many went.
std::size_t dropFlatTriangles(Mesh& mesh);

// A tolerance relative to the mesh's size: small enough to keep distinct features apart, large enough to
// absorb the rounding of the transforms that placed the vertices.
float defaultWeldTolerance(const Mesh& mesh);

// Labels each vertex with its connected piece (vertices joined through triangles), numbered from 0 in
// order of first vertex; a vertex in no triangle is a piece of its own. Answers the number of pieces.
std::size_t labelPieces(const Mesh& mesh, std::vector<std::uint32_t>& pieceOf);

// Reverses the triangles of every piece that encloses negative volume (measured about the piece's own
// centre, so that open pieces get a sensible answer too), and answers how many were turned. Files wound
// inside out, or mirrored without fixing the winding, would otherwise show the binding surfaces facing
// into the body, and a method that asks which bones a vertex faces would find none.
std::size_t orientPiecesOutward(Mesh& mesh);

// The weights of each input vertex are those of its welded vertex.
Weights unweldWeights(const Weights& welded, const std::vector<std::uint32_t>& weldOf);

}  // namespace TessikSDK::Pipeline
