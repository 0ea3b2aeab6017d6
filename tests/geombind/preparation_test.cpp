#include "geombind/preparation.h"

#include <array>
#include <limits>
#include <map>
#include <optional>
#include <random>
#include <set>
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

using Lists = std::vector<std::vector<std::uint32_t>>;

Lists lists(const IndexRows& rows) {
  Lists out;
  for (std::size_t r = 0; r < rows.size(); ++r) out.emplace_back(rows[r].begin(), rows[r].end());
  return out;
}

// A soup over 50 of 60 vertices, so the last ten are isolated: random triangles repeat directed edges
// with other opposite vertices, some repeat whole triangles or corners. Each round adds triangles to the
// same mesh, so a rebuild must also drop the previous tables.
TEST(TopologySoup, MatchesOrderedSetsBuiltTriangleByTriangle) {
  constexpr std::uint32_t kVertices = 60, kUsed = 50;
  std::mt19937 rng(7);
  std::uniform_int_distribution<std::uint32_t> vertex(0, kUsed - 1);
  MeshData mesh;
  mesh.vertices.resize(kVertices);
  for (int round = 0; round < 3; ++round) {
    for (int t = 0; t < 200; ++t) {
      const bool repeat = !mesh.triangles.empty() && rng() % 5 == 0;
      TriangleRecord tri = repeat ? mesh.triangles[rng() % mesh.triangles.size()]
                                  : TriangleRecord{vertex(rng), vertex(rng), vertex(rng)};
      if (rng() % 10 == 0) tri[rng() % 3] = tri[0];  // degenerate corners
      mesh.triangles.push_back(tri);
    }
    buildTopology(mesh);

    std::vector<std::set<std::uint32_t>> neighbours(kVertices), incident(kVertices);
    std::map<DirectedEdge, std::uint32_t> opposite;
    for (std::uint32_t t = 0; t < mesh.triangles.size(); ++t) {
      const TriangleRecord& tri = mesh.triangles[t];
      for (int i = 0; i < 3; ++i) {
        const std::uint32_t a = tri[i], b = tri[(i + 1) % 3];
        neighbours[a].insert(b);
        neighbours[b].insert(a);
        opposite[{a, b}] = tri[(i + 2) % 3];
        incident[a].insert(t);
      }
    }
    std::vector<DirectedEdge> edges;
    for (const auto& entry : opposite) edges.push_back(entry.first);
    Lists neighbourLists, incidentLists;
    for (std::uint32_t v = 0; v < kVertices; ++v) {
      neighbourLists.emplace_back(neighbours[v].begin(), neighbours[v].end());
      incidentLists.emplace_back(incident[v].begin(), incident[v].end());
    }

    EXPECT_EQ(mesh.edges, edges) << "round " << round;
    EXPECT_EQ(lists(mesh.vertexNeighbours), neighbourLists) << "round " << round;
    EXPECT_EQ(lists(mesh.vertexTriangles), incidentLists) << "round " << round;
    for (std::uint32_t a = 0; a < kVertices; ++a) {
      for (std::uint32_t b = 0; b < kVertices; ++b) {
        const auto found = opposite.find({a, b});
        const std::optional<std::uint32_t> expected =
            found == opposite.end() ? std::nullopt : std::optional<std::uint32_t>(found->second);
        ASSERT_EQ(mesh.findOpposite(a, b), expected) << a << " -> " << b << ", round " << round;
      }
    }
  }
}

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
