#pragma once

#include <cstdint>
#include <vector>

#include "asset.h"
#include "preview_scene.h"

// The preview drawn on the processor, for machines without a graphics card or any OpenGL library:
// no graphics API is touched, so no context needs to be current.
namespace tessik::bind::preview {

// Draws `scene` of `mesh` as the OpenGL path draws it: the same orthographic camera and supersampling, a
// depth-tested (nearer wins, first drawn wins a tie) fill of every triangle, both sides, with its
// vertices' colours interpolated across it, then the skeleton's layers painted over everything in order.
// A sample is covered when its centre lies inside a triangle; a centre on an edge shared by two
// triangles belongs to exactly one of them, so a closed surface shows no cracks and no seams.
// Returns RGBA8, top row first, scene.width * scene.height * 4 bytes. Rows are drawn in bands on OpenMP
// threads, each sample by one thread in drawing order, so every thread count gives the same bytes.
// `scene` must have been made from `mesh` (its colours index mesh.positions).
std::vector<std::uint8_t> rasterizeScene(const SurfaceMesh& mesh, const Scene& scene);

}  // namespace tessik::bind::preview
