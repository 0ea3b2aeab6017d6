#include "geombind/preparation.h"

#include <array>
#include <limits>
#include <map>
#include <vector>

#include <gtest/gtest.h>

#include "geombind/mesh.h"
#include "geombind/transform_hierarchy.h"

namespace {

using namespace TessikSDK::GeomBind;
using Float3 = std::array<float, 3>;

std::array<double, 16> rowMajor(double x, double y, double z) {
  // A rotated and scaled node: preparation must keep only its translation.
  return {0, -2, 0, x, 2, 0, 0, y, 0, 0, 2, z, 0, 0, 0, 1};
}

// Vertices (2, 2, 2) and (4, 3, 2.5): offset (2, 2, 2), scale 1 / 2, one joint at (3, 2, 2).
class Preparation : public ::testing::TestWithParam<PreparationMode> {
 protected:
  void SetUp() override {
    mesh.addVertex(2, 2, 2);
    mesh.addVertex(4, 3, 2.5f);
    ASSERT_TRUE(bones.addNode("joint", rowMajor(3, 2, 2).data(), nullptr));
  }
  MeshImpl mesh;
  TransformHierarchyImpl bones;
};

TEST_P(Preparation, MovesMeshAndJointsIntoTheUnitFrame) {
  prepareForBinding(mesh.data, bones.data, GetParam());
  const MeshData& m = mesh.data;
  EXPECT_EQ(m.normalizeOffset, (Float3{2, 2, 2}));
  EXPECT_EQ(m.normalizeScale, 0.5f);
  EXPECT_EQ(m.vertices[0].position, (Float3{0, 0, 0}));
  EXPECT_EQ(m.vertices[1].position, (Float3{1, 0.5f, 0.25f}));
  if (GetParam() == PreparationMode::geodesic) {
    EXPECT_EQ(m.boundingBox.lower, glm::dvec3(-0.00001));
    EXPECT_EQ(m.boundingBox.upper, glm::dvec3(1.00001));
  } else {
    EXPECT_EQ(m.boundingBox.lower, glm::dvec3(0));
    EXPECT_EQ(m.boundingBox.upper, glm::dvec3(1, 0.5, 0.25));
  }
  const Matrix4 expected{1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0.5, 0, 0, 1};
  EXPECT_EQ(bones.data.transforms[0], expected);
}

INSTANTIATE_TEST_SUITE_P(BothModes,
                         Preparation,
                         ::testing::Values(PreparationMode::heatmap, PreparationMode::geodesic),
                         [](const auto& info) {
                           return info.param == PreparationMode::geodesic ? "geodesic" : "heatmap";
                         });

TEST(PreparationRepeat, JointsWithoutVerticesKeepTheirPositions) {
  MeshImpl mesh;
  TransformHierarchyImpl bones;
  ASSERT_TRUE(bones.addNode("j", rowMajor(0.1, 2, 3).data(), nullptr));
  prepareForBinding(mesh.data, bones.data, PreparationMode::heatmap);
  EXPECT_EQ(bones.data.transforms[0][12], static_cast<double>(0.1f));
  EXPECT_EQ(bones.data.transforms[0][0], 1.0);
  EXPECT_EQ(bones.data.transforms[0][1], 0.0);
}

struct TopologyCase {
  const char* name;
  int vertexCount;
  std::vector<TriangleRecord> triangles;
  std::vector<DirectedEdge> edges;
  std::map<DirectedEdge, std::uint32_t> opposite;
  std::vector<std::vector<std::uint32_t>> neighbours;
  std::vector<std::vector<std::uint32_t>> incident;
};

void PrintTo(const TopologyCase& c, std::ostream* os) { *os << c.name; }

class Topology : public ::testing::TestWithParam<TopologyCase> {};

TEST_P(Topology, BuildsTheAdjacencyTables) {
  const TopologyCase& c = GetParam();
  MeshImpl mesh;
  for (int v = 0; v < c.vertexCount; ++v) mesh.addVertex(static_cast<float>(v), static_cast<float>(v * v), 0);
  for (const auto& t : c.triangles) mesh.addTriangle(t[0], t[1], t[2]);
  buildTopology(mesh.data);
  EXPECT_EQ(mesh.data.edges, c.edges);
  EXPECT_EQ(mesh.data.edgeOpposite, c.opposite);
  EXPECT_EQ(mesh.data.vertexNeighbours, c.neighbours);
  EXPECT_EQ(mesh.data.vertexTriangles, c.incident);
}

INSTANTIATE_TEST_SUITE_P(
    Preparation,
    Topology,
    ::testing::Values(
        TopologyCase{"one_triangle",
                     3,
                     {{0, 1, 2}},
                     {{0, 1}, {1, 2}, {2, 0}},
                     {{{0, 1}, 2}, {{1, 2}, 0}, {{2, 0}, 1}},
                     {{1, 2}, {0, 2}, {0, 1}},
                     {{0}, {0}, {0}}},
        TopologyCase{"two_triangles_sharing_an_edge",
                     4,
                     {{0, 1, 2}, {2, 1, 3}},
                     {{0, 1}, {1, 2}, {1, 3}, {2, 0}, {2, 1}, {3, 2}},
                     {{{0, 1}, 2}, {{1, 2}, 0}, {{2, 0}, 1}, {{2, 1}, 3}, {{1, 3}, 2}, {{3, 2}, 1}},
                     {{1, 2}, {0, 2, 3}, {0, 1, 3}, {1, 2}},
                     {{0}, {0, 1}, {0, 1}, {1}}},
        TopologyCase{
            "closed_tetrahedron_with_an_unused_vertex",
            5,
            {{0, 2, 1}, {0, 1, 3}, {1, 2, 3}, {0, 3, 2}},
            {{0, 1}, {0, 2}, {0, 3}, {1, 0}, {1, 2}, {1, 3}, {2, 0}, {2, 1}, {2, 3}, {3, 0}, {3, 1}, {3, 2}},
            {{{0, 2}, 1},
             {{2, 1}, 0},
             {{1, 0}, 2},
             {{0, 1}, 3},
             {{1, 3}, 0},
             {{3, 0}, 1},
             {{1, 2}, 3},
             {{2, 3}, 1},
             {{3, 1}, 2},
             {{0, 3}, 2},
             {{3, 2}, 0},
             {{2, 0}, 3}},
            {{1, 2, 3}, {0, 2, 3}, {0, 1, 3}, {0, 1, 2}, {}},
            {{0, 1, 3}, {0, 1, 2}, {0, 2, 3}, {1, 2, 3}, {}}}),
    [](const auto& info) { return std::string(info.param.name); });

struct BadMeshCase {
  const char* name;
  std::vector<Float3> vertices;
  std::vector<TriangleRecord> triangles;
  bool bindable;
};

void PrintTo(const BadMeshCase& c, std::ostream* os) { *os << c.name; }

class Bindable : public ::testing::TestWithParam<BadMeshCase> {};

TEST_P(Bindable, RejectsMeshesThatCannotBePrepared) {
  MeshImpl mesh;
  for (const auto& v : GetParam().vertices) mesh.addVertex(v[0], v[1], v[2]);
  for (const auto& t : GetParam().triangles) mesh.addTriangle(t[0], t[1], t[2]);
  EXPECT_EQ(isBindable(mesh.data), GetParam().bindable);
}

const float kInf = std::numeric_limits<float>::infinity();
const float kNaN = std::numeric_limits<float>::quiet_NaN();

INSTANTIATE_TEST_SUITE_P(
    Preparation,
    Bindable,
    ::testing::Values(BadMeshCase{"good", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}}, true},
                      BadMeshCase{"empty", {}, {}, true},
                      BadMeshCase{"index_at_count", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 3}}, false},
                      BadMeshCase{
                          "index_huge", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0xFFFFFFFFu, 1, 2}}, false},
                      BadMeshCase{"nan_coordinate", {{0, 0, 0}, {1, kNaN, 0}, {0, 1, 0}}, {{0, 1, 2}}, false},
                      BadMeshCase{"infinite_coordinate", {{0, 0, 0}, {kInf, 0, 0}}, {}, false},
                      BadMeshCase{"all_coincide", {{2, 2, 2}, {2, 2, 2}, {2, 2, 2}}, {{0, 1, 2}}, false},
                      BadMeshCase{"single_vertex", {{5, 5, 5}}, {}, false},
                      BadMeshCase{"scale_overflows_float", {{0, 0, 0}, {1e-39f, 0, 0}}, {}, false}),
    [](const auto& info) { return std::string(info.param.name); });

}  // namespace
