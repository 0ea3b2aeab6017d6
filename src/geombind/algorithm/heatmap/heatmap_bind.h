#pragma once

#include <cstdint>
#include <vector>

#include "geombind/algorithm/bind_strategy.h"

namespace TessikSDK::GeomBind::Algorithm {

struct HeatmapOptions : IBindOptions {
  std::int32_t influenceLimit = 0;  ///< below 1 keeps every influence
  float falloff = 0.0f;             ///< 0: distance, 1: distance squared
};

/// Depth of the octree whose leaves decide line of sight: a triangle hides a bone from a vertex when the
/// line through them crosses it and it shares a leaf of this depth with the segment between them.
constexpr std::uint32_t kOcclusionDepth = 10;

/// Area-weighted vertex normals, unit length. A vertex no triangle uses keeps the normal (0, 0, 0).
void computeVertexNormals(MeshData& mesh);

/// Triangle areas in double from the single-precision edge vectors; empty when any triangle is degenerate
/// (zero cross product or an area below 1e-10 in the unit frame).
std::vector<double> triangleAreas(const MeshData& mesh);

/// Heat-diffusion binding: every bone heats the vertices that see it among their nearest bones, the heat
/// diffuses over the surface (cotangent Laplacian, one sparse Cholesky factorisation, one solve per heat
/// source), and each bone's equilibrium temperature is its weight. Moves bones that sit exactly on a
/// vertex slightly inside (in the hierarchy itself). Lists hold bones in ascending order unless cut to
/// `influenceLimit`, then sorted by weight, largest first, ties by bone index; weights sum to 1. Empty
/// result for options of another method, no bones, vertices or triangles, a degenerate triangle, no
/// vertex seeing a bone, a singular system, or a run cancelled before the fold into bones. Issues no
/// OpenGL calls.
class HeatmapBind : public IBindStrategy {
 public:
  ~HeatmapBind() override;
  VertexWeights bind(const MeshData& mesh,
                     HierarchyData& hierarchy,
                     const IBindOptions& options,
                     IProgress& progress) override;
};

}  // namespace TessikSDK::GeomBind::Algorithm
