// How close the binding comes to weights an artist painted: every rigged asset among assimp's test
// models is bound from its bind-pose mesh and skeleton, then skinned in the same random poses with the
// file's own weights and with ours; the distance between the two surfaces, per vertex and pose, is the
// error. Rigid nearest-bone weights are the floor any binding must beat.
//
// One benchmark per asset and method, tips off and on, and one per asset for the baseline, each run
// once: the figures are the counters (mean_pct and p95_pct of the bind-pose bounding-box diagonal,
// vertices, bones), the time is only the binding's. A markdown table of the same figures goes to
// stderr at the end, for pasting into notes.

#include <cstdio>
#include <exception>
#include <iostream>
#include <iterator>
#include <map>
#include <optional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include <benchmark/benchmark.h>

#include <tessik/geombind.h>
#include <tessik/pipeline.h>

#include "asset_import.h"
#include "binding.h"
#include "common/run_benchmarks.h"
#include "headless_gl/headless_gl.h"
#include "pipeline/weight_quality.h"

namespace {

namespace bind = tessik::bind;
namespace quality = tessik::bench;

// The files of the test models that assimp reads with at least three bones; the other skinned ones
// there have one or two, and the check at load would drop them.
const char* const kCandidates[] = {"X/Testwuson.X",
                                   "X/BCN_Epileptic.X",
                                   "X/anim_test.x",
                                   "FBX/animation_with_skeleton.fbx",
                                   "FBX/huesitos.fbx",
                                   "MDL/MDL (HL1)/man.mdl",
                                   "MDL/MDL (HL1)/unnamed_bones.mdl",
                                   "Collada/cameras.dae",
                                   "Collada/lights.dae"};
constexpr int kPoses = 20;
constexpr double kSigmaDegrees = 25.0;
constexpr unsigned kSeed = 1729;

struct Asset {
  std::string name;
  bind::ImportedAsset data;
  std::vector<std::vector<bind::Mat4>> poses;
  double diagonal = 0.0;
};

const char* const kColumns[] = {"baseline", "geodesic tips off", "geodesic tips on", "heat tips off",
                                "heat tips on"};
std::map<std::string, std::map<std::string, std::string>> gTable;  // asset, column: "mean / p95"

std::optional<tessik::support::HeadlessGLContext>& madeContext() {
  static std::optional<tessik::support::HeadlessGLContext> made;
  return made;
}

// Made on the first binding, so that a run filtered to the baselines needs no driver.
const std::string& glError() {
  static const std::string error = [] {
    std::string why;
    if (!tessik::support::ensureGLContext(madeContext(), &why) && why.empty()) why = "no OpenGL context";
    return why;
  }();
  return error;
}

void report(benchmark::State& state, const Asset& a, const bind::VertexWeights& w, const char* column) {
  const std::vector<double> errors =
      quality::poseErrors(a.data.mesh.positions, *a.data.fileWeights, w, a.poses, a.diagonal);
  const double mean = quality::mean(errors), p95 = quality::percentile(errors, 0.95);
  state.counters["mean_pct"] = mean;
  state.counters["p95_pct"] = p95;
  state.counters["vertices"] = static_cast<double>(a.data.mesh.positions.size());
  state.counters["bones"] = static_cast<double>(a.data.skeleton.joints.size());
  char cell[64];
  std::snprintf(cell, sizeof cell, "%.2f / %.2f", mean, p95);
  gTable[a.name][column] = cell;
}

void BM_Baseline(benchmark::State& state, const Asset* a) {
  bind::VertexWeights w;
  for (auto _ : state) {
    w = quality::nearestBoneWeights(a->data.mesh.positions, a->data.skeleton);
    benchmark::DoNotOptimize(w.influences.data());
  }
  report(state, *a, w, kColumns[0]);
}

void BM_Bind(benchmark::State& state, const Asset* a, bind::BindSettings settings, const char* column) {
  if (!glError().empty()) {
    state.SkipWithError(glError().c_str());
    gTable[a->name][column] = "no GL";
    return;
  }
  TessikSDK::Pipeline::NullProgress quiet;
  bind::VertexWeights w;
  for (auto _ : state) {
    try {
      w = bind::bindAsset(a->data.mesh, a->data.skeleton, settings, &quiet).weights;
    } catch (const TessikSDK::Pipeline::BindError& e) {
      std::cerr << a->name << ", " << column << ": " << e.what() << "\n";
      state.SkipWithError(e.what());
      gTable[a->name][column] = "failed";
      return;
    }
  }
  report(state, *a, w, column);
}

std::vector<Asset> loadAssets() {
  std::vector<Asset> assets;
  for (const char* file : kCandidates) {
    const std::string path = std::string(TESSIK_ASSIMP_MODELS) + "/" + file;
    Asset a;
    try {
      a.data = bind::importAsset(path, false);
    } catch (const std::exception& e) {
      std::cerr << "skipped " << file << ": " << e.what() << "\n";
      continue;
    }
    if (a.data.skeleton.joints.size() < 3 || !a.data.fileWeights || a.data.fileWeights->influences.empty()) {
      std::cerr << "skipped " << file << ": " << a.data.skeleton.joints.size() << " bones\n";
      continue;
    }
    const std::string base = path.substr(path.find_last_of('/') + 1);
    a.name = base.substr(0, base.find_last_of('.'));
    a.diagonal = quality::boundingDiagonal(a.data.mesh.positions);
    std::mt19937 rng(kSeed);
    for (int p = 0; p < kPoses; ++p)
      a.poses.push_back(quality::randomPose(a.data.skeleton, rng, kSigmaDegrees));
    assets.push_back(std::move(a));
  }
  return assets;
}

void registerAll(const std::vector<Asset>& assets) {
  for (const Asset& a : assets) {
    benchmark::RegisterBenchmark(("WeightQuality/" + a.name + "/baseline").c_str(), BM_Baseline, &a)
        ->Iterations(1)
        ->Unit(benchmark::kMillisecond);
    int column = 1;
    for (const bind::BindMethod method : {bind::BindMethod::geodesic, bind::BindMethod::heatmap}) {
      for (const bool tips : {false, true}) {
        bind::BindSettings settings;
        settings.method = method;
        settings.leafTips = tips;
        const std::string name =
            "WeightQuality/" + a.name + "/" + bind::methodName(method) + (tips ? "/tips_on" : "/tips_off");
        benchmark::RegisterBenchmark(name.c_str(), BM_Bind, &a, settings, kColumns[column++])
            ->Iterations(1)
            ->Unit(benchmark::kSecond)
            ->UseRealTime();
      }
    }
  }
}

void printTable(const std::vector<Asset>& assets) {
  std::cerr << "\nError against the file's weights, % of the bounding-box diagonal, mean / p95 over "
            << kPoses << " poses (" << kSigmaDegrees << " degrees per bone):\n\n| asset | vertices | bones |";
  for (const char* c : kColumns) std::cerr << " " << c << " |";
  std::cerr << "\n|---|---:|---:|";
  for (std::size_t c = 0; c < std::size(kColumns); ++c) std::cerr << "---|";
  std::cerr << "\n";
  for (const Asset& a : assets) {
    std::cerr << "| " << a.name << " | " << a.data.mesh.positions.size() << " | "
              << a.data.skeleton.joints.size() << " |";
    for (const char* c : kColumns) {
      const auto cell = gTable[a.name].find(c);
      std::cerr << " " << (cell == gTable[a.name].end() ? "not run" : cell->second) << " |";
    }
    std::cerr << "\n";
  }
}

}  // namespace

int main(int argc, char** argv) {
  const std::vector<Asset> assets = loadAssets();
  registerAll(assets);
  const int status = tessik::bench::runBenchmarks(argc, argv);
  printTable(assets);
  madeContext().reset();
  return status;
}
