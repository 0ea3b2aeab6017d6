#include <algorithm>
#include <cmath>
#include <iostream>
#include <mutex>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tessik/pipeline.h"

#include "meshes/character.h"
#include "meshes/mesh_builders.h"
#include "pipeline/bones.h"
#include "support/gl_context_fixture.h"

namespace TessikSDK::Pipeline {
namespace {

Bone boneAt(const char* name, int parent, double x) { return Pipeline::boneAt(name, parent, x, 0.02, 0.01); }

Mesh tube(float length) {
  const tessik::meshes::TriMesh m = tessik::meshes::cylinderX(0.0f, length, 0.0f, 0.0f, 0.3f, 24, 16);
  return {m.positions, m.triangles};
}

double weightOf(const Weights& w, std::size_t v, std::uint32_t bone) {
  for (std::uint32_t i = w.begin(v); i < w.end(v); ++i)
    if (w.influences[i].bone == bone) return w.influences[i].weight;
  return 0.0;
}

class BindSkin : public tessik::test::GLContextTest, public ::testing::WithParamInterface<Method> {
 protected:
  void SetUp() override {
    GLContextTest::SetUp();
    if (IsSkipped() || HasFatalFailure()) return;
    options.method = GetParam();
  }

  Options options;
};

// A head with no child bone on a neck: without a tip of its own the head only ties with the neck past
// its joint, and turning it would move the head half as far as it should.
TEST_P(BindSkin, LeafTipsGiveTheHeadItsWholePart) {
  const Mesh mesh = tube(3.0f);
  const std::vector<Bone> bones = {boneAt("neck", -1, 0.2), boneAt("head", 0, 1.5)};
  options.leafTips = false;
  const Result without = bindSkin(mesh, bones, options);
  options.leafTips = true;
  const Result with = bindSkin(mesh, bones, options);
  EXPECT_EQ(with.report.tipsCast, 1u);
  EXPECT_EQ(without.report.tipsCast, 0u);

  double sumWithout = 0.0, minWith = 1.0;
  int headVertices = 0;
  for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
    if (mesh.positions[v][0] < 2.0f) continue;
    ++headVertices;
    sumWithout += weightOf(without.weights, v, 1);
    minWith = std::min(minWith, weightOf(with.weights, v, 1));
  }
  ASSERT_GT(headVertices, 0);
  EXPECT_GE(minWith, 0.9);
  EXPECT_NEAR(sumWithout / headVertices, 0.5, 0.2);
  // The tip's own node never shows: every influence names one of the caller's two bones.
  for (const Influence& in : with.weights.influences) EXPECT_LT(in.bone, 2u);
}

INSTANTIATE_TEST_SUITE_P(BothMethods,
                         BindSkin,
                         ::testing::Values(Method::geodesic, Method::heatmap),
                         [](const auto& info) {
                           return info.param == Method::geodesic ? "geodesic" : "heatmap";
                         });

class BindSkinGeodesic : public BindSkin {};

// A surface wound inside out, or split along its seams, is the same surface to bind; the caller still
// gets one row per vertex as given.
TEST_P(BindSkinGeodesic, SeamsAndInsideOutPiecesBindAsTheCleanSurface) {
  const Mesh clean = tube(3.0f);
  const std::vector<Bone> bones = {boneAt("a", -1, 0.3), boneAt("b", 0, 1.5), boneAt("c", 1, 2.7)};
  const Result reference = bindSkin(clean, bones, options);

  Mesh messy = clean;
  for (auto& t : messy.triangles) std::swap(t[1], t[2]);
  // Vertex 5 split in two: the triangles after the first half use a copy of it.
  const auto copy = static_cast<std::uint32_t>(messy.positions.size());
  messy.positions.push_back(messy.positions[5]);
  for (std::size_t t = messy.triangles.size() / 2; t < messy.triangles.size(); ++t)
    for (auto& corner : messy.triangles[t])
      if (corner == 5) corner = copy;
  const Result messyResult = bindSkin(messy, bones, options);
  EXPECT_EQ(messyResult.report.turnedPieces, 1u);
  EXPECT_EQ(messyResult.report.weldedVertices, clean.positions.size());
  ASSERT_EQ(messyResult.weights.numVertices(), messy.positions.size());
  for (std::size_t v = 0; v < clean.positions.size(); ++v)
    for (std::uint32_t b = 0; b < 3; ++b)
      ASSERT_EQ(weightOf(messyResult.weights, v, b), weightOf(reference.weights, v, b)) << v;
  for (std::uint32_t b = 0; b < 3; ++b)
    EXPECT_EQ(weightOf(messyResult.weights, copy, b), weightOf(reference.weights, 5, b));
  // The middle of the tube belongs to the middle bone.
  for (std::size_t v = 0; v < clean.positions.size(); ++v)
    if (std::abs(clean.positions[v][0] - 1.6f) < 0.1f) {
      EXPECT_GT(weightOf(reference.weights, v, 1), 0.5) << v;
    }
}

// A tail of three bones, the last a leaf: with its tip the end of the tail swings with the last bone
// alone, as an animator expects when only the tip is turned.
TEST_P(BindSkinGeodesic, TailTipFollowsTheLastBone) {
  const Mesh mesh = tube(3.0f);
  const std::vector<Bone> bones = {boneAt("tail1", -1, 0.1), boneAt("tail2", 0, 1.0),
                                   boneAt("tail3", 1, 1.9)};
  const Result result = bindSkin(mesh, bones, options);
  EXPECT_EQ(result.report.tipsCast, 1u);
  for (std::size_t v = 0; v < mesh.positions.size(); ++v)
    if (mesh.positions[v][0] > 2.3f) {
      EXPECT_GE(weightOf(result.weights, v, 2), 0.9) << v;
    }
}

TEST_P(BindSkinGeodesic, RebindingGivesTheSameWeightsAndConsoleStaysQuiet) {
  const Mesh mesh = tube(3.0f);
  const std::vector<Bone> bones = {boneAt("a", -1, 0.3), boneAt("b", 0, 1.5)};
  ::testing::internal::CaptureStdout();
  const Result first = bindSkin(mesh, bones, options);
  const Result second = bindSkin(mesh, bones, options);
  EXPECT_EQ(::testing::internal::GetCapturedStdout(), "");
  // Every phase is timed, the one the method runs straight out of too.
  std::vector<std::string> phases;
  for (const auto& [title, seconds] : first.report.phases) phases.push_back(title);
  EXPECT_NE(std::find(phases.begin(), phases.end(), "Voxelizing model ... "), phases.end());
  EXPECT_EQ(phases.back(), "Finishing weights");
  ASSERT_EQ(first.weights.offsets, second.weights.offsets);
  for (std::size_t i = 0; i < first.weights.influences.size(); ++i) {
    EXPECT_EQ(first.weights.influences[i].bone, second.weights.influences[i].bone);
    EXPECT_EQ(first.weights.influences[i].weight, second.weights.influences[i].weight);
  }
  for (std::size_t v = 0; v < first.weights.numVertices(); ++v) {
    ASSERT_LE(first.weights.end(v) - first.weights.begin(v), options.maxInfluences);
    double total = 0.0;
    for (std::uint32_t i = first.weights.begin(v); i < first.weights.end(v); ++i)
      total += first.weights.influences[i].weight;
    EXPECT_NEAR(total, 1.0, 1e-9);
  }
  options.verbose = true;
  ::testing::internal::CaptureStdout();
  bindSkin(mesh, bones, options);
  EXPECT_NE(::testing::internal::GetCapturedStdout().find("Total (s)"), std::string::npos);
  EXPECT_TRUE(TessikSDK::GeomBind::consoleReports()) << "the process-wide switch is put back after the call";
}

TEST_P(BindSkinGeodesic, CallbacksSeeEveryPhaseAndCanStopTheRun) {
  const Mesh mesh = tube(3.0f);
  const std::vector<Bone> bones = {boneAt("a", -1, 0.3), boneAt("b", 0, 1.5)};
  std::mutex mutex;
  std::vector<std::string> phases;
  bool inRange = true;
  Callbacks callbacks;
  callbacks.progress = [&](const std::string& phase, double fraction) {
    const std::lock_guard<std::mutex> lock(mutex);
    if (phases.empty() || phases.back() != phase) phases.push_back(phase);
    inRange = inRange && fraction >= 0.0 && fraction <= 1.0;
  };
  const Result reported = bindSkin(mesh, bones, options, callbacks);
  EXPECT_TRUE(inRange);
  ASSERT_GE(phases.size(), 4u);
  EXPECT_EQ(phases.front(), "Welding seams and orienting pieces");
  EXPECT_EQ(phases.back(), "Finishing weights");
  EXPECT_EQ(reported.weights.offsets, bindSkin(mesh, bones, options).weights.offsets);

  int asked = 0;
  callbacks.cancelled = [&] {
    const std::lock_guard<std::mutex> lock(mutex);
    return ++asked > 3;
  };
  try {
    bindSkin(mesh, bones, options, callbacks);
    FAIL() << "returned";
  } catch (const BindError& e) {
    EXPECT_EQ(e.kind(), BindError::Kind::cancelled);
  }
}

INSTANTIATE_TEST_SUITE_P(Geodesic, BindSkinGeodesic, ::testing::Values(Method::geodesic));

// The processor and the GPU voxelise the inside the same way but for ties at the surface: on the test
// character that must leave the weights all but unchanged.
TEST_P(BindSkinGeodesic, CpuAndGpuVoxelizersBindTheCharacterAlike) {
  const tessik::meshes::Character c = tessik::meshes::character(0.3);
  const Mesh mesh{c.mesh.positions, c.mesh.triangles};
  std::vector<Bone> bones;
  for (const auto& b : c.bones) {
    int parent = -1;
    for (std::size_t p = 0; p < c.bones.size(); ++p)
      if (c.bones[p].name == b.parent) parent = static_cast<int>(p);
    bones.push_back(Pipeline::boneAt(b.name.c_str(), parent, b.position[0], b.position[1], b.position[2]));
  }
  options.voxelizer = Voxelizer::gpu;
  const Result gpu = bindSkin(mesh, bones, options);
  options.voxelizer = Voxelizer::cpu;
  const Result cpu = bindSkin(mesh, bones, options);
  EXPECT_TRUE(gpu.report.interiorOnGpu);
  EXPECT_FALSE(cpu.report.interiorOnGpu);

  std::size_t sameDominant = 0;
  double difference = 0.0;
  const std::size_t n = mesh.positions.size();
  for (std::size_t v = 0; v < n; ++v) {
    sameDominant += gpu.weights.influences[gpu.weights.begin(v)].bone ==
                    cpu.weights.influences[cpu.weights.begin(v)].bone;
    for (std::uint32_t b = 0; b < bones.size(); ++b)
      difference += std::abs(weightOf(gpu.weights, v, b) - weightOf(cpu.weights, v, b));
  }
  EXPECT_GE(static_cast<double>(sameDominant), 0.995 * static_cast<double>(n));
  EXPECT_LE(difference / static_cast<double>(n), 0.01) << "summed over bones, per vertex";
}

}  // namespace
}  // namespace TessikSDK::Pipeline
