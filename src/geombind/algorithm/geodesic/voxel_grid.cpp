#include "geombind/algorithm/geodesic/voxel_grid.h"

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

std::uint64_t cellIndexOf(const glm::dvec3& p,
                          const Collision::AABB& box,
                          const std::array<std::uint32_t, 3>& dims) {
  const glm::dvec3 size = cellSize(box, dims);
  const std::uint32_t x = cellOf(p.x, box.lower.x, size.x, dims[0]);
  const std::uint32_t y = cellOf(p.y, box.lower.y, size.y, dims[1]);
  const std::uint32_t z = cellOf(p.z, box.lower.z, size.z, dims[2]);
  return (std::uint64_t{z} * dims[1] + y) * dims[0] + x;
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

VoxelGrid buildCoarserLevel(const VoxelGrid& finer, const Collision::AABB& box) {
  VoxelGrid coarse;
  coarse.dims = {finer.dims[0] / 2, finer.dims[1] / 2, finer.dims[2] / 2};
  coarse.cells.assign(static_cast<std::size_t>(cellCount(coarse.dims)), Empty);
  const glm::dvec3 half = cellSize(box, finer.dims) * 0.5;
  const glm::dvec3 size = cellSize(box, coarse.dims);
  const std::uint32_t nx = coarse.dims[0], ny = coarse.dims[1];
  const std::int64_t count = static_cast<std::int64_t>(coarse.cells.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    const auto index = static_cast<std::uint64_t>(i);
    const glm::dvec3 cell(static_cast<double>(index % nx), static_cast<double>(index / nx % ny),
                          static_cast<double>(index / (std::uint64_t{nx} * ny)));
    const glm::dvec3 centre = box.lower + (cell + 0.5) * size;
    for (int sample = 0; sample < 8; ++sample) {
      const glm::dvec3 at =
          centre + glm::dvec3((sample & 1) ? half.x : -half.x, (sample & 2) ? half.y : -half.y,
                              (sample & 4) ? half.z : -half.z);
      if (finer.cells[static_cast<std::size_t>(cellIndexOf(at, box, finer.dims))] != Empty) {
        coarse.cells[static_cast<std::size_t>(i)] = Interior;
        break;
      }
    }
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
    for (std::size_t i = levels.size() - 1; i-- > 0;)
      levels[i] = buildCoarserLevel(levels[i + 1], mesh.boundingBox);
  }
  profiler.stopTimer(static_cast<std::uint32_t>(timer));
  progress.update(3);
  return levels;
}

}  // namespace TessikSDK::GeomBind::Algorithm
