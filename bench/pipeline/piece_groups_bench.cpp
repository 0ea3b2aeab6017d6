// What binding in groups of pieces costs next to one binding of the whole: the character alone, and the
// same character with small closed shells floating beside it (buttons, eyes, a prop) that no bone can be
// seen from. Those make the whole surface's heat system singular, so the pipeline falls back to binding
// its pieces in groups, halving the failing group until the shells are alone.
//
// The time is one bindSkin call (heat method). group_cost is that time over the best of three bindings
// of the character alone, in the same process: about 2 means the groups together cost one failed whole
// attempt plus one binding.

#include <algorithm>
#include <array>
#include <chrono>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include <tessik/pipeline.h>

#include "common/gl_context.h"
#include "common/run_benchmarks.h"
#include "meshes/character.h"
#include "meshes/mesh_builders.h"

namespace {

namespace pipeline = TessikSDK::Pipeline;
namespace meshes = tessik::meshes;

struct Input {
  pipeline::Mesh mesh;
  std::vector<pipeline::Bone> bones;
};

Input MakeInput(int shells) {
  meshes::Character c = meshes::character(0.4);
  for (int s = 0; s < shells; ++s) {
    const float x = 0.6f + 0.08f * static_cast<float>(s % 4), y = 0.3f + 0.3f * static_cast<float>(s / 4);
    c.mesh.append(meshes::sphere({x - 0.72f, y, 0.4f}, 0.025f, 8, 12));
  }
  Input input;
  input.mesh.positions = c.mesh.positions;
  input.mesh.triangles = c.mesh.triangles;
  for (const meshes::Bone& b : c.bones) {
    pipeline::Bone bone;
    bone.name = b.name;
    for (std::size_t p = 0; p < c.bones.size(); ++p)
      if (c.bones[p].name == b.parent) bone.parent = static_cast<int>(p);
    bone.bindPose = {1, 0, 0, b.position[0], 0, 1, 0, b.position[1], 0, 0, 1, b.position[2], 0, 0, 0, 1};
    input.bones.push_back(bone);
  }
  return input;
}

double BindSeconds(const Input& input, bool* byPiece) {
  pipeline::Options options;
  options.method = pipeline::Method::heatmap;
  const auto start = std::chrono::steady_clock::now();
  const pipeline::Result result = pipeline::bindSkin(input.mesh, input.bones, options);
  const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  if (byPiece != nullptr) *byPiece = result.report.boundByPiece;
  return seconds;
}

void BM_PieceGroups(benchmark::State& state) {
  // The binding context asks for OpenGL whichever method runs.
  if (const std::string& error = tessik::bench::ensureGL(); !error.empty()) {
    state.SkipWithError(error.c_str());
    return;
  }
  const int shells = static_cast<int>(state.range(0));
  const Input whole = MakeInput(0), withShells = MakeInput(shells);
  bool byPiece = false;
  double total = 0.0;
  for (auto _ : state) {
    const double seconds = BindSeconds(withShells, &byPiece);
    state.SetIterationTime(seconds);
    total += seconds;
  }
  if (shells > 0 && !byPiece) {
    state.SkipWithError("the shells did not make the pipeline bind by piece");
    return;
  }
  double alone = BindSeconds(whole, nullptr);
  for (int i = 0; i < 2; ++i) alone = std::min(alone, BindSeconds(whole, nullptr));
  state.counters["group_cost"] = total / static_cast<double>(state.iterations()) / alone;
  state.counters["vertices"] = static_cast<double>(withShells.mesh.positions.size());
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::RegisterBenchmark("BM_PieceGroups", BM_PieceGroups)
      ->Arg(0)
      ->Arg(4)
      ->Arg(16)
      ->ArgName("shells")
      ->UseManualTime()
      ->Iterations(3)
      ->Unit(benchmark::kMillisecond);
  const int status = tessik::bench::runBenchmarks(argc, argv);
  tessik::bench::releaseGL();
  return status;
}
