// Cost of the work every binding does before its method runs, on the character-like mesh at about 50k
// and 200k vertices (30 bones).
//
// BM_PrepareForBinding times prepareForBinding alone on a fresh copy of the host's mesh and bones, made
// untimed. Counters, seconds per iteration:
//   - split_topology: buildTopology alone, on a second copy normalised untimed;
//   - teardown: destroying the prepared copy, untimed in the loop; a host pays it when it disposes of
//     the mesh, a second binding when it rebuilds the tables.
//
// BM_ContextPreparation times prepareBindInputs, the context's whole pre-bind step, as a second binding
// of the same objects meets it: the host's data put back, checked, the previous tables replaced, the
// mesh prepared (and given normals in heat-map mode).
//
// Wall-clock time throughout, single-threaded work.

#include <array>
#include <chrono>
#include <cstddef>
#include <map>
#include <memory>
#include <utility>

#include <benchmark/benchmark.h>

#include "common/run_benchmarks.h"
#include "geombind/context.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/transform_hierarchy.h"
#include "meshes/character.h"

namespace {

using TessikSDK::GeomBind::MeshImpl;
using TessikSDK::GeomBind::PreparationMode;
using TessikSDK::GeomBind::TransformHierarchyImpl;
namespace GeomBind = TessikSDK::GeomBind;
namespace meshes = tessik::meshes;
using Clock = std::chrono::steady_clock;

struct Host {
  MeshImpl mesh;
  TransformHierarchyImpl hierarchy;
};

// Filled through the host interface, as a host would; built once per size, the large one takes a while.
Host& HostFor(int kiloVertices) {
  static std::map<int, std::unique_ptr<Host>> hosts;
  std::unique_ptr<Host>& host = hosts[kiloVertices];
  if (host != nullptr) return *host;
  host = std::make_unique<Host>();
  const meshes::Character source = meshes::character(kiloVertices / 25.0);
  for (const meshes::Vec3& p : source.mesh.positions) host->mesh.addVertex(p[0], p[1], p[2]);
  for (const auto& t : source.mesh.triangles) host->mesh.addTriangle(t[0], t[1], t[2]);
  for (const meshes::Bone& bone : source.bones) {
    const meshes::Vec3& j = bone.position;
    const std::array<double, 16> matrix = {1, 0, 0, j[0], 0, 1, 0, j[1], 0, 0, 1, j[2], 0, 0, 0, 1};
    host->hierarchy.addNode(bone.name.c_str(), matrix.data(), bone.parentName());
  }
  return *host;
}

double SecondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

void SetSizeCounters(benchmark::State& state, const Host& host) {
  state.counters["vertices"] = static_cast<double>(host.mesh.data.vertices.size());
  state.counters["triangles"] = static_cast<double>(host.mesh.data.triangles.size());
}

void BM_PrepareForBinding(benchmark::State& state) {
  const Host& host = HostFor(static_cast<int>(state.range(0)));
  double topology = 0.0, teardown = 0.0;
  for (auto _ : state) {
    state.PauseTiming();
    auto mesh = std::make_unique<GeomBind::MeshData>(host.mesh.data);
    auto hierarchy = std::make_unique<GeomBind::HierarchyData>(host.hierarchy.data);
    state.ResumeTiming();

    GeomBind::prepareForBinding(*mesh, *hierarchy, PreparationMode::geodesic);

    state.PauseTiming();
    Clock::time_point start = Clock::now();
    mesh.reset();
    teardown += SecondsSince(start);
    GeomBind::MeshData normalised = host.mesh.data;
    GeomBind::normalizeMesh(normalised);
    start = Clock::now();
    GeomBind::buildTopology(normalised);
    topology += SecondsSince(start);
    benchmark::DoNotOptimize(normalised.edges.data());
    state.ResumeTiming();
  }
  const auto iterations = static_cast<double>(state.iterations());
  state.counters["split_topology"] = topology / iterations;
  state.counters["teardown"] = teardown / iterations;
  SetSizeCounters(state, host);
}

void BM_ContextPreparation(benchmark::State& state) {
  Host& host = HostFor(static_cast<int>(state.range(0)));
  const auto mode = state.range(1) == 0 ? PreparationMode::heatmap : PreparationMode::geodesic;
  // A first binding, untimed: the timed ones find a prepared mesh, as every later binding does.
  GeomBind::prepareBindInputs(&host.mesh, &host.hierarchy, mode);
  for (auto _ : state) {
    const GeomBind::BindInputs inputs = GeomBind::prepareBindInputs(&host.mesh, &host.hierarchy, mode);
    if (inputs.mesh == nullptr) {
      state.SkipWithError("the character was refused");
      return;
    }
    benchmark::DoNotOptimize(inputs.mesh->edges.data());
  }
  SetSizeCounters(state, host);
}

void RegisterAll() {
  for (int kiloVertices : {50, 200}) {
    const int iterations = kiloVertices == 50 ? 10 : 4;
    benchmark::RegisterBenchmark("BM_PrepareForBinding", BM_PrepareForBinding)
        ->Arg(kiloVertices)
        ->ArgName("kverts")
        ->Iterations(iterations)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
    for (int geodesic : {0, 1}) {
      benchmark::RegisterBenchmark("BM_ContextPreparation", BM_ContextPreparation)
          ->Args({kiloVertices, geodesic})
          ->ArgNames({"kverts", "geodesic"})
          ->Iterations(iterations)
          ->Unit(benchmark::kMillisecond)
          ->UseRealTime();
    }
  }
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  return tessik::bench::runBenchmarks(argc, argv);
}
