#include "geombind/algorithm/heatmap/heat_system.h"

#include <array>
#include <cmath>
#include <vector>

#include <gtest/gtest.h>

#include "collision/octree_sight.h"
#include "geombind/algorithm/heatmap/heat_sources.h"
#include "geombind/algorithm/heatmap/heatmap_bind.h"
#include "geombind/collision/occlusion_index.h"
#include "geombind/preparation.h"
#include "meshes/character.h"

namespace {

using namespace TessikSDK::GeomBind;
using namespace TessikSDK::GeomBind::Algorithm;

TEST(HeatSystem, UnitSquareLaplacianRows) {
  MeshImpl square;
  for (auto [x, y] : {std::pair{0, 0}, {1, 0}, {1, 1}, {0, 1}}) square.addVertex(float(x), float(y), 0);
  square.addTriangle(0, 1, 2);
  square.addTriangle(0, 2, 3);
  buildTopology(square.data);
  const std::vector<double> areas = triangleAreas(square.data);
  ASSERT_EQ(areas, (std::vector<double>{0.5, 0.5}));
  SourceVisibility none;  // no sources: no heat, the rows are the Laplacian alone
  none.distances.assign(0, 0.0);
  const HeatSystem system = assembleHeatSystem(square.data, areas, none);
  using Row = TessikSDK::Cholesky::SparseRow;
  EXPECT_EQ(system.rows[0], (Row{{0, 2.0}}));
  EXPECT_EQ(system.rows[1], (Row{{0, -1.0}, {1, 2.0}}));
  EXPECT_EQ(system.rows[3], (Row{{0, -1.0}, {2, -1.0}, {3, 2.0}}));
  ASSERT_EQ(system.rows[2].size(), 3u);
  EXPECT_EQ(system.rows[2][0].first, 0);
  EXPECT_EQ(system.rows[2][0].second, 0.0);
  EXPECT_TRUE(std::signbit(system.rows[2][0].second)) << "two right angles: -(0 + 0) is stored as -0.0";
  EXPECT_EQ(system.vertexArea, (std::vector<double>{1.0, 0.5, 1.0, 0.5}));
}

// One vertex at the origin facing +z, bones below it as tip joints, and one far triangle so the index
// has something to hold. Optionally a triangle between the vertex and the bones.
struct Scene {
  explicit Scene(bool wall = false) {
    mesh.vertices.push_back({{0, 0, 1}, {0, 0, 0}});
    for (auto p : {std::array<float, 3>{5, 5, 5}, {6, 5, 5}, {5, 6, 5}})
      mesh.vertices.push_back({{0, 0, 1}, p});
    mesh.triangles.push_back({1, 2, 3});
    if (wall) {
      for (auto p : {std::array<float, 3>{-1, -1, -0.5f}, {2, -1, -0.5f}, {-1, 2, -0.5f}}) {
        mesh.vertices.push_back({{0, 0, 1}, p});
      }
      mesh.triangles.push_back({4, 5, 6});
    }
    std::vector<Collision::Triangle> list;
    for (const auto& t : mesh.triangles) list.push_back(triangleOf(mesh, t));
    triangles = Collision::OcclusionIndex(Collision::AABB(glm::dvec3(-2), glm::dvec3(7)), list, 4);
  }
  // Tip bones at the given positions; returns whether vertex 0 sees each.
  std::vector<bool> sees(const std::vector<glm::dvec3>& bones, double falloff) {
    HierarchyData h;
    for (std::size_t b = 0; b < bones.size(); ++b) {
      h.names.push_back("b" + std::to_string(b));
      h.transforms.push_back({1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, bones[b].x, bones[b].y, bones[b].z, 1});
    }
    const SourceVisibility v = computeSourceVisibility(
        mesh, h, [this](const Collision::Segment& s) { return triangles.blocked(s); }, collectHeatSources(h),
        falloff, 0.01f);
    std::vector<bool> seen;
    for (std::size_t b = 0; b < bones.size(); ++b) seen.push_back(v.isVisible(0, b));
    return seen;
  }
  MeshData mesh;
  Collision::OcclusionIndex triangles;
};

TEST(HeatVisibility, NearestWithinOneHundredthOfAPercentAreTested) {
  Scene scene;
  const glm::dvec3 down(0, 0, -1);
  EXPECT_EQ(scene.sees({down, down * 1.00005}, 0.0), (std::vector<bool>{true, true}));
  EXPECT_EQ(scene.sees({down, down * 1.0002}, 0.0), (std::vector<bool>{true, false}));
  // The tolerance is on the measure: d^2 doubles the gap.
  EXPECT_EQ(scene.sees({down, down * 1.00007}, 0.0), (std::vector<bool>{true, true}));
  EXPECT_EQ(scene.sees({down, down * 1.00007}, 1.0), (std::vector<bool>{true, false}));
}

TEST(HeatVisibility, NormalMustFaceAwayFromTheBoneWithinSixtyDegrees) {
  Scene scene;
  auto at = [](double degrees) {
    const double r = degrees * 3.14159265358979323846 / 180.0;
    return glm::dvec3(std::sin(r), 0.0, -std::cos(r));  // degrees off the straight-down direction
  };
  EXPECT_EQ(scene.sees({at(59.0)}, 0.0), (std::vector<bool>{true}));
  EXPECT_EQ(scene.sees({at(61.0)}, 0.0), (std::vector<bool>{false}));
}

TEST(HeatVisibility, TriangleInBetweenBlocks) {
  Scene walled(true);
  EXPECT_EQ(walled.sees({glm::dvec3(0, 0, -1)}, 0.0), (std::vector<bool>{false}));
}

TEST(HeatVisibility, BoneOnAVertexIsPushedInsideAlongItsNormal) {
  MeshData mesh;
  mesh.vertices.push_back({{0, 0, 1}, {0.5f, 0.25f, 0.0f}});
  HierarchyData h;
  h.transforms.push_back({1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0.5, 0.25, 0.0, 1});
  pushBonesOffVertices(mesh, h, 0.125f);
  EXPECT_EQ(h.transforms[0][12], 0.5);
  EXPECT_EQ(h.transforms[0][14], -0.125);
}

TEST(HeatSources, ChainGivesItsTipAndTwoSegments) {
  HierarchyData h;
  for (const char* n : {"a", "b", "c"}) {
    h.nameToIndex[n] = static_cast<std::uint32_t>(h.names.size());
    h.names.push_back(n);
    h.transforms.push_back({});
  }
  h.parentNames = {{"a", ""}, {"b", "a"}, {"c", "b"}};
  const HeatSources s = collectHeatSources(h);
  EXPECT_EQ(s.tipJoints, (std::vector<std::uint32_t>{2}));
  EXPECT_EQ(s.boneSegments, (std::vector<std::pair<std::uint32_t, std::uint32_t>>{{0, 1}, {1, 2}}));
  EXPECT_DOUBLE_EQ(distanceMeasure(0.5, 0.0), 0.5);
  EXPECT_DOUBLE_EQ(distanceMeasure(0.5, 1.0), 0.25);
}

TEST(HeatSystem, VertexOnABoneGetsABoundedHeatTerm) {
  MeshImpl tri;
  tri.addVertex(0, 0, 0);
  tri.addVertex(1, 0, 0);
  tri.addVertex(0, 1, 0);
  tri.addTriangle(0, 1, 2);
  buildTopology(tri.data);
  SourceVisibility v;
  v.sourceCount = 1;
  v.distances = {0.0, 0.5, 0.5};
  v.visible = {1, 1, 1};
  VertexWeights out;
  ASSERT_TRUE(solveHeat(tri.data, triangleAreas(tri.data), v, out));
  for (const auto& list : out) {
    ASSERT_EQ(list.size(), 1u);
    EXPECT_TRUE(std::isfinite(list[0].weight));
    EXPECT_LE(list[0].weight, 1.0);
  }
}

// The index must hide exactly what the depth-10 octree hides on a whole character: the rest of the bind
// reads nothing else of the triangles, so equal bits give equal weights.
TEST(HeatVisibility, IndexAndOctreeGiveIdenticalBits) {
  const tessik::meshes::Character source = tessik::meshes::character(0.05);
  MeshImpl mesh;
  for (const auto& p : source.mesh.positions) mesh.addVertex(p[0], p[1], p[2]);
  for (const auto& t : source.mesh.triangles) mesh.addTriangle(t[0], t[1], t[2]);
  TransformHierarchyImpl bones;
  for (const auto& bone : source.bones) {
    const auto& j = bone.position;
    const std::array<double, 16> m = {1, 0, 0, j[0], 0, 1, 0, j[1], 0, 0, 1, j[2], 0, 0, 0, 1};
    bones.addNode(bone.name.c_str(), m.data(), bone.parentName());
  }
  prepareForBinding(mesh.data, bones.data, PreparationMode::heatmap);
  computeVertexNormals(mesh.data);
  std::vector<Collision::Triangle> list;
  for (const auto& t : mesh.data.triangles) list.push_back(triangleOf(mesh.data, t));
  const Collision::OcclusionIndex index(mesh.data.boundingBox, list, kOcclusionDepth);
  const Collision::Testing::OctreeSight octree(mesh.data.boundingBox, list, kOcclusionDepth);
  const HeatSources sources = collectHeatSources(bones.data);
  pushBonesOffVertices(mesh.data, bones.data, 0.01f);

  auto withIndex = [&](const Collision::Segment& s) { return index.blocked(s); };
  auto withOctree = [&](const Collision::Segment& s) { return octree.blocked(s); };
  const SourceVisibility fast =
      computeSourceVisibility(mesh.data, bones.data, withIndex, sources, 0.5, 0.01f);
  const SourceVisibility reference =
      computeSourceVisibility(mesh.data, bones.data, withOctree, sources, 0.5, 0.01f);
  ASSERT_EQ(fast.visible, reference.visible);
  std::size_t seen = 0, tested = 0;
  for (std::size_t v = 0; v < mesh.data.vertices.size(); ++v) {
    double nearest = fast.distance(v, 0);
    for (std::size_t e = 0; e < sources.count(); ++e) nearest = std::min(nearest, fast.distance(v, e));
    for (std::size_t e = 0; e < sources.count(); ++e) {
      tested += fast.distance(v, e) <= nearest * 1.0001;
      seen += fast.isVisible(v, e);
    }
  }
  // Hidden nearest bones must occur, or equal bits would say nothing about the blocking test.
  EXPECT_GT(seen, tested / 2);
  EXPECT_LT(seen, tested);
}

}  // namespace
