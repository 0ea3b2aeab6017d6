#include "pipeline/weld.h"

#include <algorithm>
#include <map>

#include <gtest/gtest.h>

namespace TessikSDK::Pipeline {
namespace {

// A unit cube as importers deliver it: four vertices of its own per face, so that each face can carry
// its own normal.
Mesh splitCube() {
  Mesh m;
  const int faces[6][4][3] = {
      {{0, 0, 0}, {0, 1, 0}, {1, 1, 0}, {1, 0, 0}}, {{0, 0, 1}, {1, 0, 1}, {1, 1, 1}, {0, 1, 1}},
      {{0, 0, 0}, {1, 0, 0}, {1, 0, 1}, {0, 0, 1}}, {{0, 1, 0}, {0, 1, 1}, {1, 1, 1}, {1, 1, 0}},
      {{0, 0, 0}, {0, 0, 1}, {0, 1, 1}, {0, 1, 0}}, {{1, 0, 0}, {1, 1, 0}, {1, 1, 1}, {1, 0, 1}}};
  for (const auto& f : faces) {
    const auto base = static_cast<std::uint32_t>(m.positions.size());
    for (const auto& c : f) m.positions.push_back({float(c[0]), float(c[1]), float(c[2])});
    m.triangles.push_back({base, base + 1, base + 2});
    m.triangles.push_back({base, base + 2, base + 3});
  }
  return m;
}

TEST(WeldTest, SeamSplitCubeBecomesOneClosedSurface) {
  const Mesh cube = splitCube();
  const WeldedMesh w = weldByPosition(cube, defaultWeldTolerance(cube));
  ASSERT_EQ(w.mesh.positions.size(), 8u);
  ASSERT_EQ(w.mesh.triangles.size(), 12u);
  ASSERT_EQ(w.weldOf.size(), 24u);
  for (std::size_t v = 0; v < cube.positions.size(); ++v)
    EXPECT_EQ(w.mesh.positions[w.weldOf[v]], cube.positions[v]);
  // Closed: every edge is shared by exactly two triangles once the seams are joined.
  std::map<std::pair<std::uint32_t, std::uint32_t>, int> edges;
  for (const auto& t : w.mesh.triangles)
    for (int e = 0; e < 3; ++e) ++edges[std::minmax(t[e], t[(e + 1) % 3])];
  for (const auto& [edge, uses] : edges) EXPECT_EQ(uses, 2);
}

// Far from the origin and at extreme scales the cube must weld just as it does at unit size: the
// tolerance of a box wider than 1e19 once overflowed single precision and welded everything.
TEST(WeldTest, ScaleAndDistanceDoNotChangeTheWeld) {
  for (const auto& [scale, shift] :
       std::vector<std::pair<float, float>>{{1e-6f, 1.0f}, {1e20f, 0.0f}, {1e20f, 1e21f}, {1e6f, 1e12f}}) {
    Mesh cube = splitCube();
    for (auto& p : cube.positions)
      for (float& c : p) c = c * scale + shift;
    const WeldedMesh w = weldByPosition(cube, defaultWeldTolerance(cube));
    EXPECT_EQ(w.mesh.positions.size(), 8u) << scale << " " << shift;
    EXPECT_EQ(w.mesh.triangles.size(), 12u) << scale << " " << shift;
  }
}

struct ToleranceCase {
  float offset;
  float tolerance;
  bool joined;
};

class WeldToleranceTest : public ::testing::TestWithParam<ToleranceCase> {};

TEST_P(WeldToleranceTest, JoinsOnlyWithinTolerance) {
  const ToleranceCase c = GetParam();
  Mesh m;
  // The pair straddles a cell boundary of the search grid, where a lookup in one cell only would miss it.
  m.positions = {{1.0f, 2.0f, 3.0f}, {1.0f + c.offset, 2.0f - c.offset, 3.0f}, {5.0f, 5.0f, 5.0f}};
  const WeldedMesh w = weldByPosition(m, c.tolerance);
  EXPECT_EQ(w.weldOf[0] == w.weldOf[1], c.joined);
  EXPECT_NE(w.weldOf[2], w.weldOf[0]);
}

INSTANTIATE_TEST_SUITE_P(Offsets,
                         WeldToleranceTest,
                         ::testing::Values(ToleranceCase{0.0f, 0.0f, true},
                                           ToleranceCase{1e-6f, 0.0f, false},
                                           ToleranceCase{0.9e-3f, 1e-3f, true},
                                           ToleranceCase{1.1e-3f, 1e-3f, false}));

TEST(WeldTest, CollapsedTrianglesAreDroppedAndWeightsFollowTheWeld) {
  Mesh m;
  m.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {1, 0, 0}};
  m.triangles = {{0, 1, 2}, {0, 1, 3}, {3, 2, 0}};  // the second collapses onto the edge 0-1
  const WeldedMesh w = weldByPosition(m, 0.0f);
  ASSERT_EQ(w.mesh.triangles.size(), 2u);
  EXPECT_EQ(w.mesh.triangles[1], (std::array<std::uint32_t, 3>{1, 2, 0}));

  Weights welded;
  welded.offsets = {0, 1, 3, 3};  // vertex 2 has none
  welded.influences = {{4, 1.0f}, {1, 0.75f}, {2, 0.25f}};
  const Weights out = unweldWeights(welded, w.weldOf);
  ASSERT_EQ(out.numVertices(), 4u);
  EXPECT_EQ(out.end(2) - out.begin(2), 0u);
  ASSERT_EQ(out.end(3) - out.begin(3), 2u);
  EXPECT_EQ(out.influences[out.begin(3)].bone, 1u);
  EXPECT_EQ(out.influences[out.begin(3) + 1].weight, 0.25f);
}

}  // namespace
}  // namespace TessikSDK::Pipeline
