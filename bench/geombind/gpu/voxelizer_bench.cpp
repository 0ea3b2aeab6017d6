// Cost of the GPU interior voxelization on a 50k-triangle torus in the unit frame, at the grid sizes
// binding uses, set beside a CPU ray-parity reference on the same grid.
//
// BM_VoxelizeInterior times voxelizeInterior itself. Its counters split that cost: each iteration
// also runs the same work again, untimed, through castAxisVotes with SweepTimings (which waits for the
// GPU before every readback, so rendering and readback separate) and a separate classifyVotes on a
// fresh grid. The rerun is not counted in the benchmark's own time.
//
// BM_CpuAxisSweep times the CPU voxelizer (Cpu::voxelizeInterior, the same decision without OpenGL)
// on the torus, counting where it disagrees with voxelizeInterior, and on the 50k-triangle test
// character; its sweeps_s counter is an untimed rerun of the sweeps alone, the rest being classification.
// Its CPU column is the process's CPU time over all threads: on a shared machine, that divided by the
// thread count says more than the wall-clock time.
//
// BM_CpuRayParity marks a voxel inside when a ray from its centre along +x crosses the mesh an odd
// number of times, and counts the voxels where that disagrees with voxelizeInterior.
//
// Everything uses wall-clock time: llvmpipe and the OpenMP loops work on threads other than the
// benchmark's.

#include <algorithm>
#include <array>
#include <bitset>
#include <chrono>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <glm/vec3.hpp>
#include <omp.h>

#include "common/gl_context.h"
#include "common/run_benchmarks.h"
#include "geombind/cpu/axis_sweep_voxelizer.h"
#include "geombind/gpu/slice_voxelizer.h"
#include "geombind/mesh.h"
#include "geombind/voxel_bit_grid.h"
#include "gl/gl_api.h"
#include "meshes/character.h"
#include "meshes/mesh_builders.h"

namespace {

using TessikSDK::GeomBind::AxisVoteGrid;
using TessikSDK::GeomBind::IProgress;
using TessikSDK::GeomBind::kAxisVoteMasks;
using TessikSDK::GeomBind::MeshData;
using TessikSDK::GeomBind::VoxelBitGrid;
using TessikSDK::GeomBind::Collision::AABB;
namespace Gpu = TessikSDK::GeomBind::Gpu;

// 250 x 100 quads, two triangles each: 50k triangles, a dense production mesh.
constexpr int kRingSteps = 250;
constexpr int kTubeSteps = 100;

// The frame the binding prepares: positions in the unit cube, the grid over a slightly padded cube.
MeshData MakeMesh() {
  const tessik::meshes::TriMesh torus =
      tessik::meshes::torus({0.5f, 0.5f, 0.5f}, 0.3f, 0.15f, kRingSteps, kTubeSteps);
  MeshData mesh;
  mesh.vertices.reserve(torus.positions.size());
  for (const auto& p : torus.positions) mesh.vertices.push_back({{0.0f, 0.0f, 0.0f}, p});
  mesh.triangles = torus.triangles;
  mesh.boundingBox = AABB(glm::dvec3(-0.00001), glm::dvec3(1.00001));
  return mesh;
}

const MeshData& TheMesh() {
  static const MeshData mesh = MakeMesh();
  return mesh;
}

// The test character (51k triangles) scaled uniformly into the unit cube.
const MeshData& TheCharacter() {
  static const MeshData mesh = [] {
    tessik::meshes::TriMesh body = tessik::meshes::character(1.0).mesh;
    std::array<float, 3> lo = body.positions[0], hi = lo;
    for (const auto& p : body.positions)
      for (int k = 0; k < 3; ++k) lo[k] = std::min(lo[k], p[k]), hi[k] = std::max(hi[k], p[k]);
    const float scale = 1.0f / std::max({hi[0] - lo[0], hi[1] - lo[1], hi[2] - lo[2]});
    MeshData m;
    for (const auto& p : body.positions)
      m.vertices.push_back(
          {{0.0f, 0.0f, 0.0f}, {(p[0] - lo[0]) * scale, (p[1] - lo[1]) * scale, (p[2] - lo[2]) * scale}});
    m.triangles = body.triangles;
    m.boundingBox = AABB(glm::dvec3(-0.00001), glm::dvec3(1.00001));
    return m;
  }();
  return mesh;
}

double SecondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// The last voxelizeInterior result per resolution, for the reference to compare against.
std::map<std::uint32_t, VoxelBitGrid>& GpuGrids() {
  static std::map<std::uint32_t, VoxelBitGrid> grids;
  return grids;
}

std::uint64_t CountSet(const VoxelBitGrid& grid) {
  std::uint64_t count = 0;
  for (std::uint32_t w : grid.bits) count += std::bitset<32>(w).count();
  return count;
}

// Padding bits past the last cell are clear in both grids, so whole words can be compared.
std::uint64_t CountDifferent(const VoxelBitGrid& a, const VoxelBitGrid& b) {
  std::uint64_t count = 0;
  for (std::size_t i = 0; i < a.bits.size(); ++i) count += std::bitset<32>(a.bits[i] ^ b.bits[i]).count();
  return count;
}

void BM_VoxelizeInterior(benchmark::State& state) {
  const std::string& error = tessik::bench::ensureGL();
  if (!error.empty()) {
    state.SkipWithError(error.c_str());
    return;
  }
  const MeshData& mesh = TheMesh();
  const auto n = static_cast<std::uint32_t>(state.range(0));
  const std::array<std::uint32_t, 3> dims = {n, n, n};
  TessikSDK::GeomBind::NullProgress progress;
  VoxelBitGrid grid;
  Gpu::SweepTimings sweeps;
  double classifySeconds = 0.0;
  std::uint64_t oneVote = 0;
  bool castFailed = false;
  for (auto _ : state) {
    state.PauseTiming();
    grid = VoxelBitGrid(n, n, n);
    state.ResumeTiming();
    Gpu::voxelizeInterior(progress, mesh, grid, false, 0.0f);

    state.PauseTiming();
    AxisVoteGrid votes{dims, std::vector<std::uint8_t>(static_cast<std::size_t>(grid.cellCount()), 0)};
    castFailed = !Gpu::castAxisVotes(mesh, votes, Gpu::builtinShaders(), &sweeps);
    if (!castFailed) {
      VoxelBitGrid fresh(n, n, n);
      std::vector<std::uint32_t> ambiguous;
      const auto start = std::chrono::steady_clock::now();
      TessikSDK::GeomBind::classifyVotes(progress, votes, fresh, false, ambiguous);
      classifySeconds += SecondsSince(start);
      oneVote = 0;
      for (std::uint8_t v : votes.votes) {
        const int axes =
            ((v & kAxisVoteMasks[0]) != 0) + ((v & kAxisVoteMasks[1]) != 0) + ((v & kAxisVoteMasks[2]) != 0);
        oneVote += axes == 1;
      }
    }
    state.ResumeTiming();
    if (castFailed) break;
  }
  if (castFailed) {
    state.SkipWithError("the voxelizer's shaders did not build (see stderr)");
    return;
  }
  using benchmark::Counter;
  state.counters["sweeps_s"] = Counter(sweeps.renderSeconds, Counter::kAvgIterations);
  state.counters["readback_s"] = Counter(sweeps.readbackSeconds, Counter::kAvgIterations);
  state.counters["classify_s"] = Counter(classifySeconds, Counter::kAvgIterations);
  state.counters["inside"] = static_cast<double>(CountSet(grid));
  // What refinement by winding number would have to settle; the benchmark runs without it.
  state.counters["one_vote"] = static_cast<double>(oneVote);
  state.counters["triangles"] = static_cast<double>(mesh.triangles.size());
  GpuGrids()[n] = std::move(grid);
}

void BM_CpuAxisSweep(benchmark::State& state) {
  const auto n = static_cast<std::uint32_t>(state.range(0));
  const bool character = state.range(1) != 0;
  const MeshData& mesh = character ? TheCharacter() : TheMesh();
  TessikSDK::GeomBind::NullProgress progress;
  VoxelBitGrid grid;
  for (auto _ : state) {
    state.PauseTiming();
    grid = VoxelBitGrid(n, n, n);
    state.ResumeTiming();
    TessikSDK::GeomBind::Cpu::voxelizeInterior(progress, mesh, grid, false, 0.0f);
  }
  AxisVoteGrid votes{grid.dims, std::vector<std::uint8_t>(static_cast<std::size_t>(grid.cellCount()), 0)};
  const auto start = std::chrono::steady_clock::now();
  TessikSDK::GeomBind::Cpu::castAxisVotes(progress, mesh, votes);
  state.counters["sweeps_s"] = SecondsSince(start);
  state.counters["inside"] = static_cast<double>(CountSet(grid));
  state.counters["triangles"] = static_cast<double>(mesh.triangles.size());
  const auto found = GpuGrids().find(n);
  if (!character && found != GpuGrids().end())
    state.counters["disagree"] = static_cast<double>(CountDifferent(grid, found->second));
}

// Ray parity along +x. All voxels of one x row share the line their rays lie on, so the row's
// crossings are found once and each centre counts those beyond it: the same answer as one ray per
// voxel, for n times less work. Triangles are bucketed by the rows their yz box covers.
//
// The rays pass a tiny fixed offset in y and z away from the voxel centres so they do not run exactly
// through the lattice's edges and vertices, where the parity of a naive test breaks.
VoxelBitGrid CpuRayParity(const MeshData& mesh, std::uint32_t n) {
  const glm::dvec3 lower = mesh.boundingBox.lower;
  const glm::dvec3 d = (mesh.boundingBox.upper - lower) / static_cast<double>(n);
  const double jitterY = 7.0710678e-7, jitterZ = 5.7735027e-7;
  auto rowY = [&](std::uint32_t j) { return lower.y + (j + 0.5) * d.y + jitterY; };
  auto rowZ = [&](std::uint32_t k) { return lower.z + (k + 0.5) * d.z + jitterZ; };
  // The rows whose line can pass through [lo, hi] on one axis; widened by one row because the exact
  // test below decides anyway.
  auto rowRange = [n](double lo, double hi, double origin, double step) {
    const double first = std::floor((lo - origin) / step - 0.5);
    const double last = std::ceil((hi - origin) / step - 0.5);
    return std::array<std::int64_t, 2>{std::max<std::int64_t>(0, static_cast<std::int64_t>(first)),
                                       std::min<std::int64_t>(n - 1, static_cast<std::int64_t>(last))};
  };

  const std::size_t rows = std::size_t{n} * n;
  const std::size_t triangleCount = mesh.triangles.size();
  std::vector<std::array<std::array<std::int64_t, 2>, 2>> spans(triangleCount);
  std::vector<std::uint32_t> rowStart(rows + 1, 0);
  for (std::size_t t = 0; t < triangleCount; ++t) {
    double lo[3], hi[3];
    for (int a = 0; a < 3; ++a) {
      lo[a] = hi[a] = mesh.vertices[mesh.triangles[t][0]].position[a];
      for (int v = 1; v < 3; ++v) {
        lo[a] = std::min<double>(lo[a], mesh.vertices[mesh.triangles[t][v]].position[a]);
        hi[a] = std::max<double>(hi[a], mesh.vertices[mesh.triangles[t][v]].position[a]);
      }
    }
    spans[t] = {rowRange(lo[1], hi[1], lower.y, d.y), rowRange(lo[2], hi[2], lower.z, d.z)};
    for (std::int64_t k = spans[t][1][0]; k <= spans[t][1][1]; ++k)
      for (std::int64_t j = spans[t][0][0]; j <= spans[t][0][1]; ++j) ++rowStart[k * n + j + 1];
  }
  for (std::size_t r = 0; r < rows; ++r) rowStart[r + 1] += rowStart[r];
  std::vector<std::uint32_t> bucket(rowStart[rows]);
  std::vector<std::uint32_t> fill(rowStart.begin(), rowStart.end() - 1);
  for (std::size_t t = 0; t < triangleCount; ++t)
    for (std::int64_t k = spans[t][1][0]; k <= spans[t][1][1]; ++k)
      for (std::int64_t j = spans[t][0][0]; j <= spans[t][0][1]; ++j)
        bucket[fill[k * n + j]++] = static_cast<std::uint32_t>(t);

  VoxelBitGrid grid(n, n, n);
  const double startX = lower.x - 1.0;  // left of every triangle, so each crossing has t > 0
  const auto rowCount = static_cast<std::int64_t>(rows);
#pragma omp parallel num_threads(omp_get_num_procs())
  {
    std::vector<double> crossings;
#pragma omp for schedule(dynamic, 64)
    for (std::int64_t r = 0; r < rowCount; ++r) {
      const auto j = static_cast<std::uint32_t>(r % n), k = static_cast<std::uint32_t>(r / n);
      const glm::dvec3 origin(startX, rowY(j), rowZ(k));
      crossings.clear();
      for (std::uint32_t b = rowStart[r]; b < rowStart[r + 1]; ++b) {
        const auto& tri = mesh.triangles[bucket[b]];
        const auto& pa = mesh.vertices[tri[0]].position;
        const auto& pb = mesh.vertices[tri[1]].position;
        const auto& pc = mesh.vertices[tri[2]].position;
        const glm::dvec3 a(pa[0], pa[1], pa[2]), b1(pb[0], pb[1], pb[2]), c(pc[0], pc[1], pc[2]);
        // Moller-Trumbore with the direction (1, 0, 0) written out.
        const glm::dvec3 e1 = b1 - a, e2 = c - a;
        const glm::dvec3 p(0.0, -e2.z, e2.y);  // direction x e2
        const double det = e1.y * p.y + e1.z * p.z;
        if (det == 0.0) continue;  // parallel to the ray
        const double inv = 1.0 / det;
        const glm::dvec3 s = origin - a;
        const double u = (s.y * p.y + s.z * p.z) * inv;
        if (u < 0.0 || u > 1.0) continue;
        const glm::dvec3 q(s.y * e1.z - s.z * e1.y, s.z * e1.x - s.x * e1.z, s.x * e1.y - s.y * e1.x);
        const double v = q.x * inv;  // direction . q
        if (v < 0.0 || u + v > 1.0) continue;
        crossings.push_back(startX + (e2.x * q.x + e2.y * q.y + e2.z * q.z) * inv);
      }
      std::sort(crossings.begin(), crossings.end());
      std::size_t passed = 0;  // crossings at or before the current centre
      for (std::uint32_t i = 0; i < n; ++i) {
        const double centre = lower.x + (i + 0.5) * d.x;
        while (passed < crossings.size() && crossings[passed] <= centre) ++passed;
        if ((crossings.size() - passed) % 2 == 1) grid.setAtomic(grid.cellIndex(i, j, k));
      }
    }
  }
  return grid;
}

void BM_CpuRayParity(benchmark::State& state) {
  const MeshData& mesh = TheMesh();
  const auto n = static_cast<std::uint32_t>(state.range(0));
  VoxelBitGrid grid;
  for (auto _ : state) {
    grid = CpuRayParity(mesh, n);
    const std::uint32_t* const bits = grid.bits.data();
    benchmark::DoNotOptimize(bits);
  }
  state.counters["inside"] = static_cast<double>(CountSet(grid));
  state.counters["triangles"] = static_cast<double>(mesh.triangles.size());

  // Runs alone (filtered) still get their comparison, at the price of one untimed voxelization.
  auto found = GpuGrids().find(n);
  if (found == GpuGrids().end() && tessik::bench::ensureGL().empty()) {
    VoxelBitGrid gpu(n, n, n);
    TessikSDK::GeomBind::NullProgress progress;
    Gpu::voxelizeInterior(progress, mesh, gpu, false, 0.0f);
    found = GpuGrids().emplace(n, std::move(gpu)).first;
  }
  if (found == GpuGrids().end()) {
    state.SetLabel("no GL context, nothing to compare with");
    return;
  }
  const VoxelBitGrid& gpu = found->second;
  const auto differ = static_cast<double>(CountDifferent(grid, gpu));
  state.counters["disagree"] = differ;
  // Which way the disagreements go: voxels cut by the surface can fall to either side.
  state.counters["gpu_only"] =
      (differ + static_cast<double>(CountSet(gpu)) - static_cast<double>(CountSet(grid))) / 2;
  state.counters["cpu_only"] =
      (differ - static_cast<double>(CountSet(gpu)) + static_cast<double>(CountSet(grid))) / 2;
  state.counters["disagree_pct"] = 100.0 * differ / static_cast<double>(grid.cellCount());
}

void RegisterAll() {
  // One iteration of voxelizeInterior at 256 takes seconds on llvmpipe and runs twice, counting the
  // untimed split, so the GPU side gets few iterations; the reference takes milliseconds.
  struct Size {
    int resolution;
    int gpuIterations;
    int cpuIterations;
  };
  for (const Size& s : {Size{64, 5, 20}, Size{128, 3, 10}, Size{256, 2, 5}}) {
    benchmark::RegisterBenchmark("BM_VoxelizeInterior", BM_VoxelizeInterior)
        ->Arg(s.resolution)
        ->ArgName("res")
        ->Iterations(s.gpuIterations)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
    for (const int character : {0, 1})
      benchmark::RegisterBenchmark("BM_CpuAxisSweep", BM_CpuAxisSweep)
          ->Args({s.resolution, character})
          ->ArgNames({"res", "character"})
          ->Iterations(s.cpuIterations)
          ->Unit(benchmark::kMillisecond)
          ->MeasureProcessCPUTime()
          ->UseRealTime();
    benchmark::RegisterBenchmark("BM_CpuRayParity", BM_CpuRayParity)
        ->Arg(s.resolution)
        ->ArgName("res")
        ->Iterations(s.cpuIterations)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
  }
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  const int status = tessik::bench::runBenchmarks(argc, argv);
  GpuGrids().clear();
  tessik::bench::releaseGL();
  return status;
}
