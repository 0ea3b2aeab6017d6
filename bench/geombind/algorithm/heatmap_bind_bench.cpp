// Cost of a whole heat-map binding: a 500-vertex tube on a chain of five bones, and a character-like
// mesh (30 bones) at about 10k and 50k vertices, split by stage. The targets on a two-core machine: the
// tube in 50 ms and 80 MB, the 50k character in 1 s and 250 MB.
//
// BM_HeatmapBind times HeatmapBind::bind alone (falloff 0.5, four influences). Each iteration binds a
// fresh copy of the mesh and hierarchy, prepared and given normals untimed, because preparation changes
// both in place and the bind moves joints that sit on vertices. Counters:
//   - split_*: seconds per stage of one further bind, rebuilt step by step from the stage functions the
//     bind calls, after the timed iterations so it cannot disturb them. The bind offers no hooks, so
//     this is the only way to see inside it. split_index is building the triangle index that decides
//     line of sight; split_ordering is part of split_factor, timed by a second, separate ordering of the
//     same matrix; split_solves is solveHeat less the assembly and factorisation it repeats. split_rest
//     is the timed mean less split_total: mapping sources to bones, truncating and normalising, and the
//     allocator's state;
//   - peak_rss_mib: the process's resident high-water mark after the timed iterations. It never goes
//     down, so the sizes are registered in ascending order and each reading belongs to the largest run
//     yet;
//   - empty_lists / unnormalised / over_limit: vertices the bind left without weights, whose weights do
//     not sum to 1, or with more than four influences: a check that the timed run did real work.
//
// Wall-clock time throughout: the OpenMP loops work on threads other than the benchmark's.

#include <array>
#include <chrono>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

#include <benchmark/benchmark.h>
#include <glm/geometric.hpp>
#include <sys/resource.h>

#include "cholesky/llt.h"
#include "common/run_benchmarks.h"
#include "geombind/algorithm/heatmap/heat_sources.h"
#include "geombind/algorithm/heatmap/heat_system.h"
#include "geombind/algorithm/heatmap/heatmap_bind.h"
#include "geombind/collision/occlusion_index.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/transform_hierarchy.h"
#include "meshes/character.h"

namespace {

using TessikSDK::GeomBind::HierarchyData;
using TessikSDK::GeomBind::IProgress;
using TessikSDK::GeomBind::MeshData;
using TessikSDK::GeomBind::MeshImpl;
using TessikSDK::GeomBind::TransformHierarchyImpl;
using TessikSDK::GeomBind::TriangleRecord;
using TessikSDK::GeomBind::VertexWeights;
namespace Algorithm = TessikSDK::GeomBind::Algorithm;
namespace Collision = TessikSDK::GeomBind::Collision;
namespace meshes = tessik::meshes;
using Clock = std::chrono::steady_clock;

constexpr float kFalloff = 0.5f;
constexpr std::int32_t kInfluenceLimit = 4;

struct Character {
  MeshData mesh;  // as the host hands it over: not yet prepared
  HierarchyData hierarchy;
};

// A closed tube along x with 5 bones in a chain down its axis: 502 vertices.
meshes::Character Tube() {
  meshes::Character tube;
  tube.mesh = meshes::cylinderX(0.0f, 5.0f, 0.0f, 0.0f, 0.4f, 24, 20);
  const char* names[] = {"b0", "b1", "b2", "b3", "b4"};
  for (int b = 0; b < 5; ++b) {
    meshes::Bone bone;
    bone.name = names[b];
    bone.parent = b == 0 ? "" : names[b - 1];
    bone.position = {0.5f + static_cast<float>(b), 0.0f, 0.0f};
    tube.bones.push_back(bone);
  }
  return tube;
}

Character MakeCharacter(double detail) {
  const meshes::Character source = detail == 0.0 ? Tube() : meshes::character(detail);
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
}

// What ContextImpl::bindHeatmap does before it hands over to the strategy.
Character Prepared(const Character& character) {
  Character copy = character;
  TessikSDK::GeomBind::prepareForBinding(copy.mesh, copy.hierarchy,
                                         TessikSDK::GeomBind::PreparationMode::heatmap);
  Algorithm::computeVertexNormals(copy.mesh);
  return copy;
}

double PeakRssMiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return static_cast<double>(usage.ru_maxrss) / 1024.0;  // ru_maxrss is in KiB on Linux
}

double SecondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

struct Split {
  double areas = 0.0;
  double index = 0.0;
  double sources = 0.0;  // collecting them and pushing bones off vertices
  double visibility = 0.0;
  double assemble = 0.0;
  double factor = 0.0;
  double ordering = 0.0;
  double solves = 0.0;
  std::size_t heatSources = 0;
  bool ok = false;

  double total() const { return areas + index + sources + visibility + assemble + factor + solves; }
};

// The bind's steps one by one, in its order and with its parameters.
Split MeasureSplit(const Character& character) {
  Character c = Prepared(character);
  const MeshData& mesh = c.mesh;
  Split split;

  Clock::time_point start = Clock::now();
  const std::vector<double> areas = Algorithm::triangleAreas(mesh);
  split.areas = SecondsSince(start);
  if (areas.empty()) return split;

  start = Clock::now();
  std::vector<Collision::Triangle> triangles;
  triangles.reserve(mesh.triangles.size());
  for (const TriangleRecord& t : mesh.triangles)
    triangles.push_back(TessikSDK::GeomBind::triangleOf(mesh, t));
  const Collision::OcclusionIndex index(mesh.boundingBox, std::move(triangles), Algorithm::kOcclusionDepth);
  split.index = SecondsSince(start);

  start = Clock::now();
  const Algorithm::HeatSources sources = Algorithm::collectHeatSources(c.hierarchy);
  const glm::dvec3 halfDiagonal = (index.bounds().upper - index.bounds().lower) * 0.5;
  const auto pushDistance =
      static_cast<float>(static_cast<double>(0.05f) * std::sqrt(glm::dot(halfDiagonal, halfDiagonal)));
  Algorithm::pushBonesOffVertices(mesh, c.hierarchy, pushDistance);
  split.sources = SecondsSince(start);
  split.heatSources = sources.count();

  start = Clock::now();
  const Algorithm::SourceVisibility visibility = Algorithm::computeSourceVisibility(
      mesh, c.hierarchy, [&index](const Collision::Segment& seg) { return index.blocked(seg); }, sources,
      static_cast<double>(kFalloff), pushDistance);
  split.visibility = SecondsSince(start);
  if (!visibility.anyVisible) return split;

  start = Clock::now();
  const Algorithm::HeatSystem system = Algorithm::assembleHeatSystem(mesh, areas, visibility);
  split.assemble = SecondsSince(start);

  start = Clock::now();
  {
    const std::unique_ptr<TessikSDK::Cholesky::LLTMatrix> factor =
        TessikSDK::Cholesky::factorLLT(system.rows);
    split.factor = SecondsSince(start);
    if (factor == nullptr) return split;
  }  // released before solveHeat makes its own, so that two factors never coexist

  start = Clock::now();
  const std::vector<std::int32_t> order = TessikSDK::Cholesky::minimumDegreeOrder(system.rows);
  split.ordering = SecondsSince(start);
  const std::size_t ordered = order.size();
  benchmark::DoNotOptimize(ordered);

  VertexWeights weights;
  start = Clock::now();
  const bool solved = Algorithm::solveHeat(mesh, areas, visibility, weights);
  split.solves = SecondsSince(start) - split.assemble - split.factor;
  split.ok = solved;
  return split;
}

struct Size {
  int kiloVertices;  // the name the run carries; 0 for the tube
  double detail;     // of the character; 0 for the tube
  int iterations;
};

constexpr std::array<Size, 3> kSizes = {Size{0, 0.0, 20}, Size{10, 0.4, 3}, Size{50, 2.0, 3}};

void BM_HeatmapBind(benchmark::State& state) {
  const Size* size = nullptr;
  for (const Size& s : kSizes)
    if (s.kiloVertices == state.range(0)) size = &s;
  const Character character = MakeCharacter(size->detail);

  Algorithm::HeatmapOptions options;
  options.influenceLimit = kInfluenceLimit;
  options.falloff = kFalloff;
  Algorithm::HeatmapBind strategy;
  TessikSDK::GeomBind::NullProgress progress;
  double bindSeconds = 0.0;
  std::size_t emptyLists = 0, unnormalised = 0, overLimit = 0;
  for (auto _ : state) {
    state.PauseTiming();
    Character c = Prepared(character);
    state.ResumeTiming();

    const Clock::time_point start = Clock::now();
    VertexWeights weights = strategy.bind(c.mesh, c.hierarchy, options, progress);
    bindSeconds += SecondsSince(start);

    state.PauseTiming();
    const std::size_t produced = weights.size();
    benchmark::DoNotOptimize(produced);
    emptyLists = 0;
    unnormalised = 0;
    overLimit = 0;
    for (const auto& list : weights) {
      double sum = 0.0;
      for (const auto& w : list) sum += w.weight;
      emptyLists += list.empty();
      unnormalised += !list.empty() && std::fabs(sum - 1.0) > 1e-4;
      overLimit += list.size() > static_cast<std::size_t>(kInfluenceLimit);
    }
    if (produced != character.mesh.vertices.size()) {
      state.ResumeTiming();
      state.SkipWithError("the bind returned no weights");
      return;
    }
    // Freed here, paused: the adjacency maps of a 50k-vertex copy take a while to tear down.
    VertexWeights().swap(weights);
    c = Character();
    state.ResumeTiming();
  }
  const double peakRss = PeakRssMiB();

  const Split split = MeasureSplit(character);
  if (!split.ok) {
    state.SkipWithError("the step-by-step bind failed where the whole one did not");
    return;
  }
  const double meanBind = bindSeconds / static_cast<double>(state.iterations());

  state.counters["split_areas"] = split.areas;
  state.counters["split_index"] = split.index;
  state.counters["split_sources"] = split.sources;
  state.counters["split_visibility"] = split.visibility;
  state.counters["split_assemble"] = split.assemble;
  state.counters["split_factor"] = split.factor;
  state.counters["split_ordering"] = split.ordering;
  state.counters["split_solves"] = split.solves;
  state.counters["split_total"] = split.total();
  state.counters["split_rest"] = meanBind - split.total();
  state.counters["peak_rss_mib"] = peakRss;
  state.counters["empty_lists"] = static_cast<double>(emptyLists);
  state.counters["unnormalised"] = static_cast<double>(unnormalised);
  state.counters["over_limit"] = static_cast<double>(overLimit);
  state.counters["heat_sources"] = static_cast<double>(split.heatSources);
  state.counters["vertices"] = static_cast<double>(character.mesh.vertices.size());
  state.counters["triangles"] = static_cast<double>(character.mesh.triangles.size());
  state.counters["bones"] = static_cast<double>(character.hierarchy.nodeCount());
}

void RegisterAll() {
  // Ascending, so that each peak_rss_mib reading is the high-water mark of the largest run so far.
  for (const Size& s : kSizes) {
    benchmark::RegisterBenchmark("BM_HeatmapBind", BM_HeatmapBind)
        ->Arg(s.kiloVertices)
        ->ArgName("kverts")
        ->Iterations(s.iterations)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
  }
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  return tessik::bench::runBenchmarks(argc, argv);
}
