#pragma once

#include <cstdint>
#include <vector>

#include "cholesky/llt.h"
#include "geombind/algorithm/heatmap/heat_sources.h"
#include "geombind/mesh.h"
#include "geombind/sparse_vertex_weights.h"

namespace TessikSDK::GeomBind::Algorithm {

/// The system both the factorisation and the right-hand sides come from.
struct HeatSystem {
  Cholesky::SparseSymmetricMatrix rows;  ///< lower triangle per vertex, diagonal last
  std::vector<std::int32_t> nearestSource;
  std::vector<double> heatValue;
  std::vector<double> vertexArea;
};

/// Nearest distance measure below which the heat term stops growing: a vertex lying on a bone would
/// otherwise get an infinite diagonal.
constexpr double kNearestMeasureFloor = 1e-6;

/// Rows of L + diag(A H): the cotangent Laplacian of the surface plus, per vertex, its area times a heat
/// term k / Dmin^2 from the k visible sources tied with its nearest one. A vertex no triangle uses gets
/// a unit diagonal and nothing else, so it stays out of the diffusion. Parallel over vertices.
HeatSystem assembleHeatSystem(const MeshData& mesh,
                              const std::vector<double>& triangleAreas,
                              const SourceVisibility& visibility);

/// Factorises once and solves all sources as one block. Output: per vertex, (source, weight) in ascending
/// source order for every solution value above 1e-8, clipped at 1. False when the mesh has no vertices or the
/// matrix is not positive definite; the output is then empty.
bool solveHeat(const MeshData& mesh,
               const std::vector<double>& triangleAreas,
               const SourceVisibility& visibility,
               VertexWeights& output);

}  // namespace TessikSDK::GeomBind::Algorithm
