#include "geombind/algorithm/heatmap/heat_system.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <optional>

#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

namespace {

// Cotangent of the angle at `o` in the triangle (i, k, o); differences in single precision.
double cotangentAt(const MeshData& mesh, std::uint32_t i, std::uint32_t k, std::uint32_t o) {
  const auto& pi = mesh.vertices[i].position;
  const auto& pk = mesh.vertices[k].position;
  const auto& po = mesh.vertices[o].position;
  const double u[3] = {pi[0] - po[0], pi[1] - po[1], pi[2] - po[2]};
  const double v[3] = {pk[0] - po[0], pk[1] - po[1], pk[2] - po[2]};
  const double dot = u[0] * v[0] + u[1] * v[1] + u[2] * v[2];
  const double cx = u[1] * v[2] - u[2] * v[1], cy = u[2] * v[0] - u[0] * v[2], cz = u[0] * v[1] - u[1] * v[0];
  return dot / std::sqrt(cx * cx + cy * cy + cz * cz);
}

double oppositeCotangent(
    const MeshData& mesh, std::uint32_t from, std::uint32_t to, std::uint32_t i, std::uint32_t k) {
  const std::optional<std::uint32_t> opposite = mesh.findOpposite(from, to);
  return opposite ? cotangentAt(mesh, i, k, *opposite) : 0.0;
}

}  // namespace

HeatSystem assembleHeatSystem(const MeshData& mesh,
                              const std::vector<double>& triangleAreas,
                              const SourceVisibility& visibility) {
  const std::size_t vertexCount = mesh.vertices.size();
  const std::size_t sources = visibility.sourceCount;
  HeatSystem system;
  system.rows.resize(vertexCount);
  system.nearestSource.assign(vertexCount, -1);
  system.heatValue.assign(vertexCount, 0.0);
  system.vertexArea.assign(vertexCount, 0.0);

  const std::int64_t count = static_cast<std::int64_t>(vertexCount);
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t vi = 0; vi < count; ++vi) {
    const auto i = static_cast<std::uint32_t>(vi);
    double nearest = std::numeric_limits<double>::max();
    for (std::size_t e = 0; e < sources; ++e) {
      if (visibility.distance(i, e) < nearest) {
        nearest = visibility.distance(i, e);
        system.nearestSource[i] = static_cast<std::int32_t>(e);
      }
    }
    const double threshold = nearest * 1.0001;
    const double bounded = std::max(nearest, kNearestMeasureFloor);
    for (std::size_t e = 0; e < sources; ++e) {
      if (visibility.isVisible(i, e) && visibility.distance(i, e) <= threshold) {
        system.heatValue[i] += 1.0 / (bounded * bounded);
      }
    }
    Cholesky::SparseRow& row = system.rows[i];
    const bool isolated = i >= mesh.vertexNeighbours.size() || mesh.vertexNeighbours[i].empty() ||
                          i >= mesh.vertexTriangles.size() || mesh.vertexTriangles[i].empty();
    if (isolated) {
      // No triangle uses it: a unit diagonal keeps the system solvable and the vertex unheated.
      row.emplace_back(static_cast<std::int32_t>(i), 1.0);
      continue;
    }
    double sum = 0.0;
    for (std::uint32_t k : mesh.vertexNeighbours[i]) {
      const double w = oppositeCotangent(mesh, k, i, i, k) + oppositeCotangent(mesh, i, k, i, k);
      sum += w;
      if (k < i) row.emplace_back(static_cast<std::int32_t>(k), -w);
    }
    for (std::uint32_t t : mesh.vertexTriangles[i]) system.vertexArea[i] += triangleAreas[t];
    row.emplace_back(static_cast<std::int32_t>(i), system.vertexArea[i] * system.heatValue[i] + sum);
    std::sort(row.begin(), row.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
  }
  return system;
}

bool solveHeat(const MeshData& mesh,
               const std::vector<double>& triangleAreas,
               const SourceVisibility& visibility,
               VertexWeights& output) {
  output.clear();
  const std::size_t vertexCount = mesh.vertices.size();
  if (vertexCount == 0) return false;
  const HeatSystem system = assembleHeatSystem(mesh, triangleAreas, visibility);
  const std::unique_ptr<Cholesky::LLTMatrix> factor = Cholesky::factorLLT(system.rows);
  if (factor == nullptr) return false;

  output.resize(vertexCount);
  const std::size_t sources = visibility.sourceCount;
  if (sources == 0) return true;
  // All sources in one block, so each sweep reads the factor once for every source.
  std::vector<double> block(vertexCount * sources);
  for (std::size_t i = 0; i < vertexCount; ++i) {
    if (system.nearestSource[i] < 0) continue;
    const double nearest = visibility.distance(i, static_cast<std::size_t>(system.nearestSource[i]));
    for (std::size_t j = 0; j < sources; ++j) {
      // Every tied source gets the vertex's whole heat term, not a share of it.
      if (visibility.isVisible(i, j) && nearest * 1.0001 >= visibility.distance(i, j)) {
        block[i * sources + j] = system.vertexArea[i] * system.heatValue[i];
      }
    }
  }
  factor->solve(block, sources);
  for (std::size_t i = 0; i < vertexCount; ++i) {
    for (std::size_t j = 0; j < sources; ++j) {
      const double w = std::min(block[i * sources + j], 1.0);
      if (w > 1e-8) output[i].push_back(BoneWeight{static_cast<std::uint32_t>(j), w});
    }
  }
  return true;
}

}  // namespace TessikSDK::GeomBind::Algorithm
