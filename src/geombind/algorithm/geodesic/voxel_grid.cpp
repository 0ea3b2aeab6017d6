#include "geombind/algorithm/geodesic/voxel_grid.h"

#include <algorithm>
#include <cmath>

#include "diagnostics/stage_profiler.h"
#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"
#include "geombind/collision/intersection.h"
#include "geombind/cpu/axis_sweep_voxelizer.h"
#include "geombind/gpu/slice_voxelizer.h"
#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

namespace {

glm::dvec3 cellSize(const Collision::AABB& box, const std::array<std::uint32_t, 3>& dims) {
  const glm::dvec3 extent = box.upper - box.lower;
  return {extent.x / dims[0], extent.y / dims[1], extent.z / dims[2]};
}

std::uint64_t cellCount(const std::array<std::uint32_t, 3>& dims) {
  return std::uint64_t{dims[0]} * dims[1] * dims[2];
}

}  // namespace

std::uint32_t cellOf(double coordinate, double lower, double size, std::uint32_t dim) {
  const auto cell = static_cast<std::uint32_t>(static_cast<std::int64_t>((coordinate - lower) / size));
  return cell < dim ? cell : dim - 1;
}

Collision::AABB octreeBox(const Collision::AABB& meshBox, std::int32_t resolution) {
  if (resolution <= 1) return meshBox;
  // For a power of two this adds exactly zero, so those resolutions keep the mesh box bit for bit.
  const double padCells = std::ldexp(1.0, ceilLog2(resolution)) - resolution;
  const glm::dvec3 size = (meshBox.upper - meshBox.lower) / static_cast<double>(resolution);
  return Collision::AABB(meshBox.lower, meshBox.upper + padCells * size);
}

std::uint8_t labelAt(const VoxelGrid& level,
                     const glm::dvec3& lower,
                     const glm::dvec3& size,
                     const glm::dvec3& p) {
  std::uint32_t cell[3];
  for (int k = 0; k < 3; ++k) {
    const double at = (p[k] - lower[k]) / size[k];
    // Written so that NaN also lands outside.
    if (!(at >= 0.0 && at < static_cast<double>(level.dims[k]))) return Empty;
    cell[k] = static_cast<std::uint32_t>(at);
  }
  return level.cells[static_cast<std::size_t>(
      (std::uint64_t{cell[2]} * level.dims[1] + cell[1]) * level.dims[0] + cell[0])];
}

void voxelizeBoundary(IProgress& progress, const MeshData& mesh, VoxelBitGrid& grid) {
  if (mesh.vertices.empty() || mesh.triangles.empty()) return;
  const Collision::AABB& box = mesh.boundingBox;
  const glm::dvec3 size = cellSize(box, grid.dims);
  const std::int64_t count = static_cast<std::int64_t>(mesh.triangles.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t t = 0; t < count; ++t) {
    if (progress.isCanceled()) continue;
    const TriangleRecord& record = mesh.triangles[static_cast<std::size_t>(t)];
    const Collision::Triangle triangle = triangleOf(mesh, record);
    const Collision::AABB bounds(triangle);
    std::uint32_t lo[3], hi[3];
    for (int k = 0; k < 3; ++k) {
      lo[k] = cellOf(bounds.lower[k], box.lower[k], size[k], grid.dims[k]);
      hi[k] = cellOf(bounds.upper[k], box.lower[k], size[k], grid.dims[k]);
    }
    for (std::uint32_t x = lo[0]; x <= hi[0]; ++x)
      for (std::uint32_t y = lo[1]; y <= hi[1]; ++y)
        for (std::uint32_t z = lo[2]; z <= hi[2]; ++z) {
          const std::uint64_t index = grid.cellIndex(x, y, z);
          // Cells already set are not tested again; several threads may share the word.
          if (grid.testAtomic(index)) continue;
          const glm::dvec3 cellLower = box.lower + glm::dvec3(x, y, z) * size;
          if (Collision::intersects(Collision::AABB(cellLower, cellLower + size), triangle)) {
            grid.setAtomic(index);
          }
        }
    progress.update(static_cast<int>(t));
  }
}

void stampLabel(VoxelGrid& level, const VoxelBitGrid& bits, VoxelLabel label) {
  const std::int64_t count = static_cast<std::int64_t>(level.cells.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    std::uint8_t& cell = level.cells[static_cast<std::size_t>(i)];
    if (cell == Empty && bits.test(static_cast<std::uint64_t>(i))) cell = label;
  }
}

VoxelGrid buildCoarserLevel(const VoxelGrid& finer) {
  VoxelGrid coarse;
  const std::array<std::uint32_t, 3>& f = finer.dims;
  coarse.dims = {f[0] / 2 + f[0] % 2, f[1] / 2 + f[1] % 2, f[2] / 2 + f[2] % 2};
  coarse.cells.assign(static_cast<std::size_t>(cellCount(coarse.dims)), Empty);
  const std::uint32_t nx = coarse.dims[0], ny = coarse.dims[1];
  const std::int64_t count = static_cast<std::int64_t>(coarse.cells.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    const auto index = static_cast<std::uint64_t>(i);
    const std::uint32_t x = static_cast<std::uint32_t>(index % nx) * 2;
    const std::uint32_t y = static_cast<std::uint32_t>(index / nx % ny) * 2;
    const std::uint32_t z = static_cast<std::uint32_t>(index / (std::uint64_t{nx} * ny)) * 2;
    bool occupied = false;
    for (std::uint32_t cz = z; cz < std::min(z + 2, f[2]) && !occupied; ++cz)
      for (std::uint32_t cy = y; cy < std::min(y + 2, f[1]) && !occupied; ++cy)
        for (std::uint32_t cx = x; cx < std::min(x + 2, f[0]) && !occupied; ++cx)
          occupied =
              finer.cells[static_cast<std::size_t>((std::uint64_t{cz} * f[1] + cy) * f[0] + cx)] != Empty;
    if (occupied) coarse.cells[static_cast<std::size_t>(i)] = Interior;
  }
  return coarse;
}

std::vector<VoxelGrid> buildGridsAndLevels(IProgress& progress,
                                           const MeshData& mesh,
                                           std::int32_t resolution,
                                           bool refineInterior,
                                           InteriorVoxelizer voxelizer) {
  Diagnostics::StageProfiler& profiler = Diagnostics::stageProfiler();
  std::vector<VoxelGrid> levels(static_cast<std::size_t>(ceilLog2(resolution)) + 1);
  const auto n = static_cast<std::uint32_t>(std::max(resolution, 0));
  VoxelGrid& finest = levels.back();
  finest.dims = {n, n, n};
  finest.cells.assign(static_cast<std::size_t>(cellCount(finest.dims)), Empty);
  VoxelBitGrid bits(n, n, n);

  int timer = profiler.startTimer("    Voxelizing volume boundary");
  if (!progress.isCanceled()) voxelizeBoundary(progress, mesh, bits);
  stampLabel(finest, bits, Boundary);
  profiler.stopTimer(static_cast<std::uint32_t>(timer));
  progress.update(1);

  timer = profiler.startTimer("    Voxelizing internal volume");
  if (!progress.isCanceled()) {
    if (voxelizer == InteriorVoxelizer::cpu) {
      Cpu::voxelizeInterior(progress, mesh, bits, refineInterior, 0.2f);
    } else {
      Gpu::voxelizeInterior(progress, mesh, bits, refineInterior, 0.2f);
    }
  }
  stampLabel(finest, bits, Interior);
  profiler.stopTimer(static_cast<std::uint32_t>(timer));
  progress.update(2);

  timer = profiler.startTimer("    Computing LODs");
  if (!progress.isCanceled() && levels.size() >= 2) {
    for (std::size_t i = levels.size() - 1; i-- > 0;) levels[i] = buildCoarserLevel(levels[i + 1]);
  }
  profiler.stopTimer(static_cast<std::uint32_t>(timer));
  progress.update(3);
  return levels;
}

}  // namespace TessikSDK::GeomBind::Algorithm
