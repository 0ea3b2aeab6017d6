// Cost of a whole geodesic sparse-voxel binding of a character-like mesh (about 50k triangles, 30
// bones) at the voxel resolutions hosts pick, split by stage.
//
// BM_GeodesicBind times GeodesicSparseVoxelBind::bind alone. Each iteration binds a fresh copy of the
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

#include <GL/glew.h>
#include <benchmark/benchmark.h>
#include <sys/resource.h>

#include "diagnostics/stage_profiler.h"
#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"
#include "geombind/algorithm/geodesic/sparse_voxels.h"
#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/collision/octree.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/transform_hierarchy.h"
#include "headless_gl/headless_gl.h"
#include "meshes/mesh_builders.h"

namespace {

using TessikSDK::GeomBind::HierarchyData;
using TessikSDK::GeomBind::IProgress;
using TessikSDK::GeomBind::MeshData;
using TessikSDK::GeomBind::MeshImpl;
using TessikSDK::GeomBind::TransformHierarchyImpl;
using TessikSDK::GeomBind::VertexWeights;
namespace Algorithm = TessikSDK::GeomBind::Algorithm;
namespace meshes = tessik::meshes;
using Vec3 = meshes::Vec3;

class NoProgress : public IProgress {
 public:
  void begin(const char*, int, int) override {}
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override { return false; }
  bool isCanceled() override { return false; }
};

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

Vec3 Add(const Vec3& a, const Vec3& b) { return {a[0] + b[0], a[1] + b[1], a[2] + b[2]}; }
Vec3 Sub(const Vec3& a, const Vec3& b) { return {a[0] - b[0], a[1] - b[1], a[2] - b[2]}; }
Vec3 Scale(const Vec3& a, float s) { return {a[0] * s, a[1] * s, a[2] * s}; }
Vec3 Cross(const Vec3& a, const Vec3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}
float Length(const Vec3& a) { return std::sqrt(a[0] * a[0] + a[1] * a[1] + a[2] * a[2]); }
Vec3 Normalized(const Vec3& a) { return Scale(a, 1.0f / Length(a)); }

// Maps the builders' x, y, z axes onto `xAxis`, `yAxis` (perpendicular to each other) and the direction
// of xAxis x yAxis scaled to `zLength`, then moves by `origin`. Such a frame is right-handed, so the
// winding stays outward; a mirror would flip it.
meshes::TriMesh Placed(
    meshes::TriMesh m, const Vec3& origin, const Vec3& xAxis, const Vec3& yAxis, float zLength) {
  const Vec3 zAxis = Scale(Normalized(Cross(xAxis, yAxis)), zLength);
  for (Vec3& p : m.positions)
    p = Add(origin, Add(Scale(xAxis, p[0]), Add(Scale(yAxis, p[1]), Scale(zAxis, p[2]))));
  return m;
}

// Any unit vector perpendicular to `d`, so that (d, it, d x it) is right-handed.
Vec3 Perpendicular(const Vec3& d) {
  const Vec3 helper = std::fabs(d[1]) < 0.9f ? Vec3{0.0f, 1.0f, 0.0f} : Vec3{1.0f, 0.0f, 0.0f};
  return Normalized(Cross(helper, d));
}

// A capped cylinder from `a` to `b`.
meshes::TriMesh Limb(const Vec3& a, const Vec3& b, float radius, int rings, int segments) {
  const Vec3 axis = Sub(b, a);
  const float length = Length(axis);
  const Vec3 d = Scale(axis, 1.0f / length);
  return Placed(meshes::cylinderX(0.0f, length, 0.0f, 0.0f, radius, rings, segments), a, d, Perpendicular(d),
                1.0f);
}

// An ellipsoid with semi-axes `radii` along x, y, z, centred at `c`.
meshes::TriMesh Ellipsoid(const Vec3& c, const Vec3& radii, int rings, int segments) {
  return Placed(meshes::sphere({0.0f, 0.0f, 0.0f}, 1.0f, rings, segments), c, {radii[0], 0.0f, 0.0f},
                {0.0f, radii[1], 0.0f}, radii[2]);
}

// Joints in metres: y up, the character faces +z, its left side at +x. Arms hang 20 degrees below
// horizontal and legs spread slightly, so no limb lies along a grid axis.
struct Skeleton {
  std::vector<std::string> names;
  std::vector<Vec3> joints;
  std::vector<std::string> parents;

  const Vec3& at(const std::string& name) const {
    return joints[static_cast<std::size_t>(std::find(names.begin(), names.end(), name) - names.begin())];
  }
  void add(const std::string& name, const Vec3& joint, const std::string& parent) {
    names.push_back(name);
    joints.push_back(joint);
    parents.push_back(parent);
  }
};

Skeleton MakeSkeleton() {
  Skeleton s;
  s.add("pelvis", {0.0f, 0.92f, 0.0f}, "");
  s.add("spine1", {0.0f, 1.05f, 0.0f}, "pelvis");
  s.add("spine2", {0.0f, 1.18f, 0.0f}, "spine1");
  s.add("chest", {0.0f, 1.32f, 0.0f}, "spine2");
  s.add("neck", {0.0f, 1.47f, 0.0f}, "chest");
  s.add("head", {0.0f, 1.62f, 0.0f}, "neck");
  const float down = 0.34906585f;  // 20 degrees
  for (const float side : {1.0f, -1.0f}) {
    const std::string p = side > 0 ? "l_" : "r_";
    const Vec3 arm = {side * std::cos(down), -std::sin(down), 0.0f};
    const Vec3 shoulder = {side * 0.2f, 1.40f, 0.0f};
    s.add(p + "clavicle", {side * 0.07f, 1.40f, 0.0f}, "chest");
    s.add(p + "shoulder", shoulder, p + "clavicle");
    s.add(p + "elbow", Add(shoulder, Scale(arm, 0.28f)), p + "shoulder");
    s.add(p + "wrist", Add(shoulder, Scale(arm, 0.53f)), p + "elbow");
    for (const float offset : {0.02f, -0.02f}) {
      const std::string finger = p + (offset > 0 ? "index" : "middle");
      const Vec3 base = Add(Add(shoulder, Scale(arm, 0.64f)), {0.0f, 0.0f, offset});
      s.add(finger + "1", base, p + "wrist");
      s.add(finger + "2", Add(base, Scale(arm, 0.045f)), finger + "1");
    }
    s.add(p + "hip", {side * 0.1f, 0.88f, 0.0f}, "pelvis");
    s.add(p + "knee", {side * 0.12f, 0.49f, 0.0f}, p + "hip");
    s.add(p + "ankle", {side * 0.13f, 0.09f, 0.0f}, p + "knee");
    s.add(p + "toe", {side * 0.13f, 0.035f, 0.15f}, p + "ankle");
  }
  return s;
}

// Overlapping closed shells, one per body part, tessellated to about 50k triangles in all.
meshes::TriMesh MakeBody(const Skeleton& s) {
  meshes::TriMesh body;
  body.append(Limb({0.0f, 0.82f, 0.0f}, {0.0f, 1.46f, 0.0f}, 0.16f, 48, 80));  // torso
  body.append(Limb({0.0f, 1.42f, 0.0f}, {0.0f, 1.58f, 0.0f}, 0.055f, 8, 48));  // neck
  body.append(Ellipsoid({0.0f, 1.68f, 0.01f}, {0.1f, 0.12f, 0.11f}, 40, 80));  // head
  for (const std::string p : {"l_", "r_"}) {
    const Vec3 arm = Normalized(Sub(s.at(p + "wrist"), s.at(p + "shoulder")));
    body.append(Limb(Sub(s.at(p + "shoulder"), Scale(arm, 0.05f)), s.at(p + "elbow"), 0.055f, 40, 48));
    body.append(Limb(Sub(s.at(p + "elbow"), Scale(arm, 0.03f)), s.at(p + "wrist"), 0.042f, 40, 48));
    // A flattened hand, then two fingers out of its far end.
    const Vec3 palm = Add(s.at(p + "wrist"), Scale(arm, 0.06f));
    body.append(Placed(meshes::sphere({0.0f, 0.0f, 0.0f}, 1.0f, 16, 32), palm, Scale(arm, 0.07f),
                       Scale(Cross({0.0f, 0.0f, 1.0f}, arm), 0.022f), 0.045f));
    for (const std::string finger : {"index", "middle"}) {
      const Vec3& base = s.at(p + finger + "1");
      body.append(Limb(Sub(base, Scale(arm, 0.02f)), Add(base, Scale(arm, 0.09f)), 0.012f, 6, 16));
    }
    body.append(Limb(Add(s.at(p + "hip"), {0.0f, 0.06f, 0.0f}), s.at(p + "knee"), 0.075f, 40, 48));
    // The shin runs on below the ankle so that the joint sits inside it, not on its cap.
    const Vec3& ankle = s.at(p + "ankle");
    body.append(
        Limb(Add(s.at(p + "knee"), {0.0f, 0.03f, 0.0f}), Add(ankle, {0.0f, -0.04f, 0.0f}), 0.052f, 40, 48));
    body.append(Ellipsoid({ankle[0], 0.045f, 0.06f}, {0.05f, 0.045f, 0.14f}, 16, 32));  // foot
  }
  return body;
}

struct Character {
  MeshData mesh;  // as the host hands it over: not yet prepared
  HierarchyData hierarchy;
};

const Character& TheCharacter() {
  static const Character character = [] {
    const Skeleton skeleton = MakeSkeleton();
    const meshes::TriMesh body = MakeBody(skeleton);
    MeshImpl mesh;
    for (const Vec3& p : body.positions) mesh.addVertex(p[0], p[1], p[2]);
    for (const auto& t : body.triangles) mesh.addTriangle(t[0], t[1], t[2]);
    TransformHierarchyImpl hierarchy;
    for (std::size_t i = 0; i < skeleton.names.size(); ++i) {
      const Vec3& j = skeleton.joints[i];
      const std::array<double, 16> matrix = {1, 0, 0, j[0], 0, 1, 0, j[1], 0, 0, 1, j[2], 0, 0, 0, 1};
      const std::string& parent = skeleton.parents[i];
      hierarchy.addNode(skeleton.names[i].c_str(), matrix.data(), parent.empty() ? nullptr : parent.c_str());
    }
    return Character{std::move(mesh.data), std::move(hierarchy.data)};
  }();
  return character;
}

// The context is made on first use so that a run filtered down to nothing never needs a driver; main()
// destroys it before static destruction, while the driver is still loaded.
struct GLState {
  bool tried = false;
  std::optional<tessik::support::HeadlessGLContext> context;
  std::string error;
};

GLState& TheGL() {
  static GLState state;
  return state;
}

// Empty when a context is current on this thread, otherwise why there is none.
const std::string& EnsureGL() {
  GLState& gl = TheGL();
  if (!gl.tried) {
    gl.tried = true;
    gl.context = tessik::support::HeadlessGLContext::create(&gl.error);
    if (!gl.context) {
      if (gl.error.empty()) gl.error = "no headless OpenGL context";
    } else {
      // Debian's GLEW is built for GLX: in an EGL context it loads every entry point, then reports only
      // that it found no X display.
      const GLenum glew = glewInit();
      if (glew != GLEW_OK && glew != GLEW_ERROR_NO_GLX_DISPLAY) {
        gl.error = std::string("glewInit: ") + reinterpret_cast<const char*>(glewGetErrorString(glew));
        gl.context.reset();
      }
    }
  }
  return gl.error;
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
  TessikSDK::GeomBind::prepareForBinding(mesh, hierarchy, true);
  NoProgress progress;
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
  const std::string& error = EnsureGL();
  if (!error.empty()) {
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

  Algorithm::GeodesicSparseVoxelBind strategy;
  NoProgress progress;
  // Keyed by counter name, in the order the stages first ran.
  std::vector<std::pair<std::string, double>> stageSeconds;
  double totalSeconds = 0.0;
  std::size_t emptyLists = 0, unnormalised = 0;
  for (auto _ : state) {
    state.PauseTiming();
    MeshData mesh = character.mesh;
    HierarchyData hierarchy = character.hierarchy;
    TessikSDK::GeomBind::prepareForBinding(mesh, hierarchy, true);
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
    benchmark::RegisterBenchmark("BM_GeodesicBind", BM_GeodesicBind)
        ->Arg(s.resolution)
        ->ArgName("res")
        ->Iterations(s.iterations)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
  }
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  TheGL().context.reset();
  return 0;
}
