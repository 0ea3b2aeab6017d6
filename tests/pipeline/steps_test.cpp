#include <functional>
#include <limits>

#include <gtest/gtest.h>

#include "tessik/pipeline.h"

#include "meshes/mesh_builders.h"
#include "pipeline/bones.h"
#include "pipeline/influences.h"

namespace TessikSDK::Pipeline {
namespace {

struct BadInput {
  const char* name;
  std::function<void(Mesh&, std::vector<Bone>&, Options&)> spoil;
  const char* message;  // a part of the one line the caller gets
};

class RefusedInput : public ::testing::TestWithParam<BadInput> {};

// Every fault is caught before anything is bound (no OpenGL context exists in this suite), and says what
// is wrong in words a caller can act on.
TEST_P(RefusedInput, IsNamedBeforeAnythingRuns) {
  Mesh mesh{{{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}}};
  std::vector<Bone> bones = {boneAt("root", -1, 0.2), boneAt("child", 0, 0.4)};
  Options options;
  GetParam().spoil(mesh, bones, options);
  try {
    bindSkin(mesh, bones, options);
    FAIL() << "accepted";
  } catch (const BindError& e) {
    EXPECT_EQ(e.kind(), BindError::Kind::invalidInput);
    EXPECT_NE(std::string(e.what()).find(GetParam().message), std::string::npos) << e.what();
  }
}

const float kNaN = std::numeric_limits<float>::quiet_NaN();

INSTANTIATE_TEST_SUITE_P(
    Faults,
    RefusedInput,
    ::testing::Values(
        BadInput{"NoVertices", [](Mesh& m, auto&, auto&) { m.positions.clear(); }, "no vertices"},
        BadInput{"NoTriangles", [](Mesh& m, auto&, auto&) { m.triangles.clear(); }, "no triangles"},
        BadInput{"IndexOutOfRange", [](Mesh& m, auto&, auto&) { m.triangles[0][2] = 3; },
                 "triangle 0 names vertex 3, but the mesh has 3 vertices"},
        BadInput{"NotFinite", [](Mesh& m, auto&, auto&) { m.positions[1][1] = kNaN; }, "vertex 1"},
        BadInput{"TooFar", [](Mesh& m, auto&, auto&) { m.positions[2][0] = 1e30f; },
                 "vertex 2 has a coordinate of"},
        BadInput{"SkeletonElsewhere",
                 [](auto&, std::vector<Bone>& b, auto&) {
                   for (Bone& bone : b) bone.bindPose[3] += 100.0;
                 },
                 "no joint lies within the mesh"},
        BadInput{"OnePoint",
                 [](Mesh& m, auto&, auto&) {
                   m.positions.assign(3, {1, 1, 1});
                 },
                 "one point"},
        BadInput{"OnlyDegenerate",
                 [](Mesh& m, auto&, auto&) {
                   m.triangles = {{0, 1, 1}};
                 },
                 "degenerate"},
        BadInput{"NoBones", [](auto&, std::vector<Bone>& b, auto&) { b.clear(); }, "no bones"},
        BadInput{"Unnamed", [](auto&, std::vector<Bone>& b, auto&) { b[1].name.clear(); },
                 "bone 1 has no name"},
        BadInput{"RepeatedName", [](auto&, std::vector<Bone>& b, auto&) { b[1].name = "root"; },
                 "repeats the name of bone 0"},
        BadInput{"ParentOutOfRange", [](auto&, std::vector<Bone>& b, auto&) { b[1].parent = 2; }, "parent 2"},
        BadInput{"Cycle", [](auto&, std::vector<Bone>& b, auto&) { b[0].parent = 1; }, "form a cycle"},
        BadInput{"PoseNotFinite", [](auto&, std::vector<Bone>& b, auto&) { b[0].bindPose[7] = kNaN; },
                 "bind pose that is not finite"},
        BadInput{"TipNotFinite",
                 [](auto&, std::vector<Bone>& b, auto&) {
                   b[1].hasTip = true;
                   b[1].tip[0] = kNaN;
                 },
                 "tip that is not finite"},
        BadInput{"ResolutionTooLow", [](auto&, auto&, Options& o) { o.resolution = 7; },
                 "between 8 and 1024"},
        BadInput{"FalloffNaN", [](auto&, auto&, Options& o) { o.falloff = kNaN; }, "falloff"},
        BadInput{"TooManyInfluences", [](auto&, auto&, Options& o) { o.maxInfluences = 65; },
                 "max influences"}),
    [](const auto& info) { return std::string(info.param.name); });

Weights rows(const std::vector<std::vector<Influence>>& perVertex) {
  Weights w;
  for (const auto& row : perVertex) {
    w.influences.insert(w.influences.end(), row.begin(), row.end());
    w.offsets.push_back(static_cast<std::uint32_t>(w.influences.size()));
  }
  return w;
}

std::vector<Influence> row(const Weights& w, std::size_t v) {
  return {w.influences.begin() + w.begin(v), w.influences.begin() + w.end(v)};
}

TEST(FoldAndLimit, TipsJoinTheirLeafBeforeTheCut) {
  // Nodes 0..2 are bones; node 3 is the tip of bone 2.
  const Weights nodes = rows({{{1, 0.3}, {2, 0.25}, {3, 0.25}, {0, 0.2}},  // leaf 0.5 outranks bone 1
                              {{0, 0.2}, {1, 0.2}, {2, 0.0}},              // a tie; zero weights go
                              {}});
  const Weights out = foldAndLimit(nodes, {0, 1, 2, 2}, 2);
  ASSERT_EQ(out.numVertices(), 3u);
  const auto first = row(out, 0);
  ASSERT_EQ(first.size(), 2u);
  EXPECT_EQ(first[0].bone, 2u);
  EXPECT_EQ(first[1].bone, 1u);
  EXPECT_NEAR(first[0].weight, 0.5 / 0.8, 1e-12);
  EXPECT_NEAR(first[0].weight + first[1].weight, 1.0, 1e-12);
  const auto second = row(out, 1);
  ASSERT_EQ(second.size(), 2u);
  EXPECT_EQ(second[0].bone, 0u) << "ties go to the lower bone, whatever order the method listed them in";
  EXPECT_DOUBLE_EQ(second[0].weight, 0.5);
  EXPECT_TRUE(row(out, 2).empty());
}

// One triangle of no area (three points on a line, one of them a vertex of its own) made the heat method
// refuse the whole surface. It is left out, and the rest binds as it would without it.
TEST(FlatTriangles, AreLeftOutAndTheRestBindsAsWithoutThem) {
  const tessik::meshes::TriMesh tube = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.3f, 12, 12);
  Mesh clean{tube.positions, tube.triangles};
  Mesh spoiled = clean;
  const auto& a = spoiled.positions[0];
  const auto& b = spoiled.positions[12];  // the next ring, same angle: the edge runs along x
  spoiled.positions.push_back({(a[0] + b[0]) / 2, (a[1] + b[1]) / 2, (a[2] + b[2]) / 2});
  spoiled.triangles.push_back({0, 12, static_cast<std::uint32_t>(spoiled.positions.size() - 1)});
  Options options;
  options.method = Method::heatmap;  // needs no OpenGL, like this suite
  const std::vector<Bone> bones = {boneAt("a", -1, 0.3), boneAt("b", 0, 1.0), boneAt("c", 1, 1.7)};
  const Result expected = bindSkin(clean, bones, options);
  const Result got = bindSkin(spoiled, bones, options);
  EXPECT_EQ(got.report.droppedTriangles, 1u);
  EXPECT_EQ(expected.report.droppedTriangles, 0u);
  for (std::size_t v = 0; v < clean.positions.size(); ++v) {
    const auto want = row(expected.weights, v), have = row(got.weights, v);
    ASSERT_EQ(have.size(), want.size()) << v;
    for (std::size_t k = 0; k < want.size(); ++k) {
      EXPECT_EQ(have[k].bone, want[k].bone) << v;
      EXPECT_NEAR(have[k].weight, want[k].weight, 1e-9) << v;
    }
  }
  EXPECT_FALSE(row(got.weights, clean.positions.size()).empty()) << "the line's own vertex still gets a row";
}

TEST(Orphans, TakeTheNearestJointWholly) {
  const Mesh mesh{{{0, 0, 0}, {0.9f, 0, 0}, {2, 0, 0}}, {{0, 1, 2}}};
  Weights w = rows({{{1, 1.0}}, {}, {}});
  EXPECT_EQ(giveOrphansNearestJoint(mesh, {boneAt("a", -1, 0.0), boneAt("b", 0, 1.0)}, w), 2u);
  EXPECT_EQ(row(w, 0)[0].bone, 1u) << "a weighted vertex keeps its weights";
  ASSERT_EQ(row(w, 1).size(), 1u);
  EXPECT_EQ(row(w, 1)[0].bone, 1u);
  EXPECT_EQ(row(w, 2)[0].bone, 1u);
  EXPECT_EQ(row(w, 2)[0].weight, 1.0);
}

}  // namespace
}  // namespace TessikSDK::Pipeline

namespace TessikSDK::Pipeline {
namespace {

TEST(CheckWeights, NamesTheFirstFaultOfAWeightTable) {
  // Three vertices over two bones; the middle vertex has no influence.
  const Weights good = rows({{{0, 1.0}}, {}, {{1, 0.25}, {0, 0.75}}});
  EXPECT_EQ(checkWeights(good, 3, 2), "");
  EXPECT_EQ(checkWeights(good, 3, 2, true), "vertex 1 has no influence with a positive weight");
  EXPECT_EQ(checkWeights(good, 4, 2), "there are weights for 3 vertices, but the mesh has 4");
  EXPECT_EQ(checkWeights(good, 3, 1), "vertex 2 names bone 1 of 1");
  Weights bad = good;
  bad.influences[1].weight = -0.25;
  EXPECT_EQ(checkWeights(bad, 3, 2), "vertex 2 has weight -0.250000");
  bad = good;
  bad.offsets = {0, 2, 1, 3};
  EXPECT_EQ(checkWeights(bad, 3, 2), "the weight offsets decrease at vertex 1");
  bad.offsets = {0, 1, 1};
  EXPECT_EQ(checkWeights(bad, 2, 2), "the weight offsets do not cover the influences");
}

}  // namespace
}  // namespace TessikSDK::Pipeline
