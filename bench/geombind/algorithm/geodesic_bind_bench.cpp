// Cost of a whole geodesic sparse-voxel binding of a character-like mesh (about 50k triangles, 30
// bones) at the voxel resolutions hosts pick, split by stage.
//
// BM_GeodesicBind times GeodesicSparseVoxelBind::bind alone, with the interior voxelised on the CPU
// (cpu:1, no OpenGL) or on the GPU (cpu:0). Each iteration binds a fresh copy of the
// mesh and hierarchy, prepared untimed, because preparation changes both in place and the bind may
// move joints. Counters:
//   - one per stage the profiler recorded (sub-stages of the voxel grids prefixed "grids_"), averaged
//     over the iterations;
//   - peak_rss_mib: the process's resident high-water mark so far. It never goes down, so the
//     resolutions are registered in ascending order and each reading belongs to the largest run yet;
//   - sparse_voxels (and how many are boundary voxels): counted by a separate, untimed octree, grid
//     and extraction run after the timing has been read, so it does not raise the peak it reports;
//   - empty_lists / unnormalised: vertices the bind left without weights or whose weights do not sum
//     to 1, a check that the timed run did real work.
//
// Wall-clock time throughout: llvmpipe and the OpenMP loops work on threads other than the
// benchmark's.

#include <algorithm>
#include <array>
#include <cctype>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <iostream>
#include <optional>
#include <streambuf>
#include <string>
#include <utility>
#include <vector>

#include <benchmark/benchmark.h>
#include <sys/resource.h>

#include "common/gl_context.h"
#include "common/run_benchmarks.h"
#include "diagnostics/stage_profiler.h"
#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"
#include "geombind/algorithm/geodesic/sparse_voxels.h"
#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/collision/octree.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/transform_hierarchy.h"
#include "gl/gl_api.h"
#include "meshes/character.h"

namespace {

using TessikSDK::GeomBind::HierarchyData;
using TessikSDK::GeomBind::IProgress;
using TessikSDK::GeomBind::MeshData;
using TessikSDK::GeomBind::MeshImpl;
using TessikSDK::GeomBind::TransformHierarchyImpl;
using TessikSDK::GeomBind::VertexWeights;
namespace Algorithm = TessikSDK::GeomBind::Algorithm;
namespace meshes = tessik::meshes;

// Swallows what the bind prints (its timing table) so the benchmark's own table stays readable.
class NullBuffer : public std::streambuf {
 protected:
  int overflow(int c) override { return traits_type::not_eof(c); }
  std::streamsize xsputn(const char*, std::streamsize count) override { return count; }
};

class CoutSilencer {
 public:
  CoutSilencer() : saved_(std::cout.rdbuf(&sink_)) {}
  ~CoutSilencer() { std::cout.rdbuf(saved_); }
  CoutSilencer(const CoutSilencer&) = delete;
  CoutSilencer& operator=(const CoutSilencer&) = delete;

 private:
  NullBuffer sink_;
  std::streambuf* saved_;
};

struct Character {
  MeshData mesh;  // as the host hands it over: not yet prepared
  HierarchyData hierarchy;
};

const Character& TheCharacter() {
  static const Character character = [] {
    const meshes::Character source = meshes::character(1.0);
    MeshImpl mesh;
    for (const meshes::Vec3& p : source.mesh.positions) mesh.addVertex(p[0], p[1], p[2]);
    for (const auto& t : source.mesh.triangles) mesh.addTriangle(t[0], t[1], t[2]);
    TransformHierarchyImpl hierarchy;
    for (const meshes::Bone& bone : source.bones) {
      const meshes::Vec3& j = bone.position;
      const std::array<double, 16> matrix = {1, 0, 0, j[0], 0, 1, 0, j[1], 0, 0, 1, j[2], 0, 0, 0, 1};
      hierarchy.addNode(bone.name.c_str(), matrix.data(), bone.parentName());
    }
    return Character{std::move(mesh.data), std::move(hierarchy.data)};
  }();
  return character;
}

// "    Voxelizing internal volume" -> "grids_voxelizing_internal_volume"; "Compute Weights" ->
// "compute_weights". Benchmark output formats break on spaces in counter names.
std::string CounterName(const std::string& label) {
  const bool sub = !label.empty() && label[0] == ' ';
  std::string name = sub ? "grids_" : "";
  bool gap = false;
  for (const char c : label) {
    if (c == ' ') {
      gap = true;
      continue;
    }
    if (gap && !name.empty() && name.back() != '_') name += '_';
    gap = false;
    name += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  }
  return name;
}

double PeakRssMiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return static_cast<double>(usage.ru_maxrss) / 1024.0;  // ru_maxrss is in KiB on Linux
}

struct VoxelCounts {
  std::size_t total = 0;
  std::size_t boundary = 0;
};

VoxelCounts CountSparseVoxels(const Character& character, std::int32_t resolution) {
  MeshData mesh = character.mesh;
  HierarchyData hierarchy = character.hierarchy;
  TessikSDK::GeomBind::prepareForBinding(mesh, hierarchy, TessikSDK::GeomBind::PreparationMode::geodesic);
  TessikSDK::GeomBind::NullProgress progress;
  TessikSDK::GeomBind::Collision::Octree octree;
  Algorithm::computeOctree(progress, mesh, hierarchy, resolution, octree);
  const std::vector<Algorithm::VoxelGrid> levels =
      Algorithm::buildGridsAndLevels(progress, mesh, resolution, false);
  Algorithm::SparseVoxelList voxels;
  Algorithm::VoxelMap voxelMap;
  Algorithm::extractSparseVoxels(octree, levels, voxels, voxelMap);
  VoxelCounts counts;
  counts.total = voxels.size();
  for (const auto& v : voxels) counts.boundary += v->label == Algorithm::Boundary;
  return counts;
}

void BM_GeodesicBind(benchmark::State& state) {
  const bool onCpu = state.range(1) != 0;
  if (const std::string& error = onCpu ? std::string() : tessik::bench::ensureGL(); !error.empty()) {
    state.SkipWithError(error.c_str());
    return;
  }
  const Character& character = TheCharacter();
  const auto resolution = static_cast<std::int32_t>(state.range(0));
  Algorithm::GeodesicSparseVoxelOptions options;
  options.resolution = resolution;
  options.influenceLimit = 4;
  options.falloff = 0.5f;
  options.refineInterior = false;
  options.smoothingIterations = Algorithm::smoothingIterationsFor(resolution);
  options.voxelizer = onCpu ? Algorithm::InteriorVoxelizer::cpu : Algorithm::InteriorVoxelizer::gpu;

  Algorithm::GeodesicSparseVoxelBind strategy;
  TessikSDK::GeomBind::NullProgress progress;
  // Keyed by counter name, in the order the stages first ran.
  std::vector<std::pair<std::string, double>> stageSeconds;
  double totalSeconds = 0.0;
  std::size_t emptyLists = 0, unnormalised = 0;
  for (auto _ : state) {
    state.PauseTiming();
    MeshData mesh = character.mesh;
    HierarchyData hierarchy = character.hierarchy;
    TessikSDK::GeomBind::prepareForBinding(mesh, hierarchy, TessikSDK::GeomBind::PreparationMode::geodesic);
    state.ResumeTiming();

    VertexWeights weights;
    {
      const CoutSilencer quiet;
      weights = strategy.bind(mesh, hierarchy, options, progress);
    }

    state.PauseTiming();
    const std::size_t produced = weights.size();
    benchmark::DoNotOptimize(produced);
    for (const auto& record : TessikSDK::Diagnostics::stageProfiler().records()) {
      const std::string name = CounterName(record.label);
      auto found = std::find_if(stageSeconds.begin(), stageSeconds.end(),
                                [&](const auto& entry) { return entry.first == name; });
      if (found == stageSeconds.end()) found = stageSeconds.insert(stageSeconds.end(), {name, 0.0});
      found->second += record.seconds;
      // Sub-stages are already inside their enclosing stage.
      if (record.label.empty() || record.label[0] != ' ') totalSeconds += record.seconds;
    }
    emptyLists = 0;
    unnormalised = 0;
    for (const auto& list : weights) {
      double sum = 0.0;
      for (const auto& w : list) sum += w.weight;
      emptyLists += list.empty();
      unnormalised += !list.empty() && std::fabs(sum - 1.0) > 1e-4;
    }
    if (produced != character.mesh.vertices.size()) {
      state.ResumeTiming();
      state.SkipWithError("the bind returned no weights");
      return;
    }
    state.ResumeTiming();
  }

  using benchmark::Counter;
  for (const auto& [name, seconds] : stageSeconds)
    state.counters[name] = Counter(seconds, Counter::kAvgIterations);
  state.counters["stages_total"] = Counter(totalSeconds, Counter::kAvgIterations);
  state.counters["peak_rss_mib"] = PeakRssMiB();
  state.counters["empty_lists"] = static_cast<double>(emptyLists);
  state.counters["unnormalised"] = static_cast<double>(unnormalised);

  const VoxelCounts voxels = CountSparseVoxels(character, resolution);
  state.counters["sparse_voxels"] = static_cast<double>(voxels.total);
  state.counters["boundary_voxels"] = static_cast<double>(voxels.boundary);
  state.counters["triangles"] = static_cast<double>(character.mesh.triangles.size());
  state.counters["vertices"] = static_cast<double>(character.mesh.vertices.size());
  state.counters["bones"] = static_cast<double>(character.hierarchy.nodeCount());
}

void RegisterAll() {
  // Ascending, so that each peak_rss_mib reading is the high-water mark of the largest run so far.
  struct Size {
    int resolution;
    int iterations;
  };
  for (const Size& s : {Size{64, 2}, Size{128, 1}, Size{256, 1}}) {
    for (int cpu : {1, 0}) {
      benchmark::RegisterBenchmark("BM_GeodesicBind", BM_GeodesicBind)
          ->Args({s.resolution, cpu})
          ->ArgNames({"res", "cpu"})
          ->Iterations(s.iterations)
          ->Unit(benchmark::kMillisecond)
          ->UseRealTime();
    }
  }
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  const int status = tessik::bench::runBenchmarks(argc, argv);
  tessik::bench::releaseGL();
  return status;
}
