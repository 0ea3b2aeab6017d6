// The tool's preview picture of the benchmark character, drawn by OpenGL (whatever driver the headless
// context finds: llvmpipe on a machine without a GPU) and by the processor.
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "common/gl_context.h"
#include "common/run_benchmarks.h"
#include "meshes/character.h"
#include "preview.h"

namespace {

using namespace tessik::bind;

struct Figure {
  SurfaceMesh mesh;
  Skeleton skeleton;
  std::vector<Mat4> jointWorld;
  VertexWeights weights;
};

// About 51k triangles; every vertex follows its nearest joint, which costs the drawing the same as a
// binding's blended weights would.
const Figure& figure() {
  static const Figure f = [] {
    const tessik::meshes::Character c = tessik::meshes::character(1.0);
    Figure out;
    out.mesh.positions = c.mesh.positions;
    out.mesh.triangles = c.mesh.triangles;
    std::map<std::string, int> index;
    for (const tessik::meshes::Bone& b : c.bones) {
      Mat4 pose = identity();
      pose[3] = b.position[0];
      pose[7] = b.position[1];
      pose[11] = b.position[2];
      index[b.name] = static_cast<int>(out.skeleton.joints.size());
      out.skeleton.joints.push_back({b.name, b.parent.empty() ? -1 : index.at(b.parent), pose, {}});
      out.jointWorld.push_back(pose);
    }
    for (const Vec3f& p : out.mesh.positions) {
      std::uint32_t nearest = 0;
      double best = HUGE_VAL;
      for (std::size_t j = 0; j < c.bones.size(); ++j) {
        const auto& q = c.bones[j].position;
        const double d = std::hypot(p[0] - q[0], p[1] - q[1], p[2] - q[2]);
        if (d < best) {
          best = d;
          nearest = static_cast<std::uint32_t>(j);
        }
      }
      out.weights.influences.push_back({nearest, 1.0});
      out.weights.offsets.push_back(static_cast<std::uint32_t>(out.weights.influences.size()));
    }
    return out;
  }();
  return f;
}

void BM_Preview(benchmark::State& state, PreviewDevice device) {
  if (device == PreviewDevice::opengl && !tessik::bench::ensureGL().empty()) {
    state.SkipWithError(tessik::bench::ensureGL().c_str());
    return;
  }
  const Figure& f = figure();
  const int size = static_cast<int>(state.range(0));
  const PreviewOptions options{size, size, device};
  for (auto _ : state)
    benchmark::DoNotOptimize(renderPreviewPixels(f.mesh, f.skeleton, f.jointWorld, f.weights, options));
  state.counters["triangles"] = static_cast<double>(f.mesh.triangles.size());
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::RegisterBenchmark("BM_Preview/cpu", BM_Preview, PreviewDevice::cpu)
      ->Arg(800)
      ->Unit(benchmark::kMillisecond);
  benchmark::RegisterBenchmark("BM_Preview/opengl", BM_Preview, PreviewDevice::opengl)
      ->Arg(800)
      ->Unit(benchmark::kMillisecond);
  const int result = tessik::bench::runBenchmarks(argc, argv);
  tessik::bench::releaseGL();
  return result;
}
