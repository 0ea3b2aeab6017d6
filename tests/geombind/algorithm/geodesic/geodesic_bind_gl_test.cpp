#include <algorithm>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <omp.h>

#include "tessik/geombind.h"

#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/progress.h"
#include "meshes/character.h"
#include "meshes/mesh_builders.h"
#include "support/gl_context_fixture.h"

namespace {

using namespace TessikSDK::GeomBind;
using tessik::meshes::TriMesh;

// Records the phases a run announces; update and isCanceled come from worker threads too.
class RecordingProgress : public IProgress {
 public:
  explicit RecordingProgress(int cancelAfterChecks = -1) : cancelAfter(cancelAfterChecks) {}
  void begin(const char* title, int total, int start) override {
    std::lock_guard<std::mutex> lock(mutex);
    calls.push_back("begin " + std::string(title) + std::to_string(total) + "," + std::to_string(start));
  }
  void end() override {
    std::lock_guard<std::mutex> lock(mutex);
    calls.push_back("end");
  }
  void setRange(int total, int start) override {
    std::lock_guard<std::mutex> lock(mutex);
    calls.push_back("setRange " + std::to_string(total) + "," + std::to_string(start));
  }
  bool update(int) override { return false; }
  bool isCanceled() override {
    std::lock_guard<std::mutex> lock(mutex);
    const int check = checks++;
    return cancelAfter >= 0 && check >= cancelAfter;
  }
  std::mutex mutex;
  std::vector<std::string> calls;
  int cancelAfter;
  int checks = 0;
};

struct Node {
  const char* name;
  const char* parent;
  double x, y, z;
};

struct Bound {
  std::size_t vertexCount = 0;
  std::vector<float> x;                                  // host x of every vertex, before the unit frame
  std::vector<std::map<std::uint32_t, double>> weights;  // per vertex: bone -> weight
};

class GeodesicBind : public tessik::test::GLContextTest {
 protected:
  Bound bind(const TriMesh& shape,
             const std::vector<Node>& nodes,
             int resolution,
             unsigned limit,
             IProgress* progress = nullptr) {
    std::unique_ptr<IContext, decltype(&IContext::dispose)> context(IContext::create(), &IContext::dispose);
    std::unique_ptr<IMesh, decltype(&IMesh::dispose)> mesh(IMesh::create(), &IMesh::dispose);
    std::unique_ptr<ITransformHierarchy, decltype(&ITransformHierarchy::dispose)> bones(
        ITransformHierarchy::create(), &ITransformHierarchy::dispose);
    EXPECT_NE(context, nullptr);
    Bound out;
    if (context == nullptr) return out;
    for (const auto& p : shape.positions) {
      mesh->addVertex(p[0], p[1], p[2]);
      out.x.push_back(p[0]);
    }
    for (const auto& t : shape.triangles) mesh->addTriangle(t[0], t[1], t[2]);
    for (const Node& n : nodes) {
      const double m[16] = {1, 0, 0, n.x, 0, 1, 0, n.y, 0, 0, 1, n.z, 0, 0, 0, 1};
      EXPECT_TRUE(bones->addNode(n.name, m, n.parent));
    }
    ISparseVertexWeights* result =
        context->bindGeodesicSparseVoxel(mesh.get(), bones.get(), progress, 0.5f, limit, resolution, false);
    out.vertexCount = result->numVertices();
    out.weights.resize(out.vertexCount);
    for (unsigned v = 0; v < out.vertexCount; ++v)
      for (unsigned k = 0; k < result->numWeights(v); ++k) {
        const BoneWeight w = result->getWeight(v, k);
        out.weights[v][w.boneIndex] += w.weight;
      }
    return out;
  }
};

// An arm along x with a three-bone chain: upper arm, forearm, hand.
const std::vector<Node> kArmChain = {
    {"upper", nullptr, 0.1, 0, 0}, {"fore", "upper", 1.0, 0, 0}, {"hand", "fore", 1.9, 0, 0}};

class GeodesicArm : public GeodesicBind, public ::testing::WithParamInterface<int> {};

TEST_P(GeodesicArm, WeightsSumToOneFallOffAlongTheArmAndFavourTheNearBone) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 40, 16);
  const Bound bound = bind(arm, kArmChain, GetParam(), 2);
  ASSERT_EQ(bound.vertexCount, arm.positions.size());
  // Vertices on one line along the arm's surface, by x.
  std::vector<std::size_t> line;
  for (std::size_t v = 0; v < arm.positions.size(); ++v) {
    const auto& w = bound.weights[v];
    ASSERT_FALSE(w.empty()) << "vertex " << v << " found no voxel";
    EXPECT_LE(w.size(), 2u);
    double sum = 0.0;
    for (const auto& [bone, weight] : w) sum += weight;
    EXPECT_NEAR(sum, 1.0, 1e-9) << "vertex " << v;
    if (arm.positions[v][1] > 0.199f && v < 41 * 16) line.push_back(v);
  }
  std::sort(line.begin(), line.end(), [&](auto a, auto b) { return bound.x[a] < bound.x[b]; });
  auto weightOf = [&](std::size_t v, std::uint32_t bone) {
    const auto found = bound.weights[v].find(bone);
    return found == bound.weights[v].end() ? 0.0 : found->second;
  };
  for (std::size_t k = 1; k < line.size(); ++k) {
    const std::size_t before = line[k - 1], after = line[k];
    if (bound.x[before] >= 1.0f) {
      EXPECT_LE(weightOf(after, 0), weightOf(before, 0) + 1e-6) << bound.x[after];
    }
    if (bound.x[after] <= 1.0f) {
      EXPECT_GE(weightOf(after, 2) + 1e-6, weightOf(before, 2)) << bound.x[after];
    }
  }
  for (std::size_t v : line) {
    if (std::abs(bound.x[v] - 0.55f) < 0.06f) {
      EXPECT_GT(weightOf(v, 0), 0.5) << bound.x[v];
    }
    if (std::abs(bound.x[v] - 1.45f) < 0.06f) {
      EXPECT_GT(weightOf(v, 1), 0.5) << bound.x[v];
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Geodesic, GeodesicArm, ::testing::Values(32, 64, 128));

// Resolutions that are not powers of two, where the octree's finest octants must still be the grid's cells.
const int kAnyResolutions[] = {48, 96, 100, 127, 200};

class GeodesicLegs : public GeodesicBind, public ::testing::WithParamInterface<int> {};

TEST_P(GeodesicLegs, SeparateShellsNeverShareBones) {
  TriMesh legs = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 20, 12);
  legs.append(tessik::meshes::cylinderX(0.0f, 2.0f, 0.8f, 0.0f, 0.2f, 20, 12));
  const std::vector<Node> nodes = {{"leftHip", nullptr, 0.1, 0, 0},
                                   {"leftKnee", "leftHip", 1.0, 0, 0},
                                   {"rightHip", nullptr, 0.1, 0.8, 0},
                                   {"rightKnee", "rightHip", 1.0, 0.8, 0}};
  const Bound bound = bind(legs, nodes, GetParam(), 0);
  ASSERT_EQ(bound.vertexCount, legs.positions.size());
  const std::size_t half = legs.positions.size() / 2;
  for (std::size_t v = 0; v < bound.vertexCount; ++v) {
    ASSERT_FALSE(bound.weights[v].empty()) << "vertex " << v << " found no voxel";
    const bool left = v < half;
    for (const auto& [bone, weight] : bound.weights[v]) {
      if ((bone < 2) != left) {
        EXPECT_EQ(weight, 0.0) << "vertex " << v << " bone " << bone;
      }
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Geodesic, GeodesicLegs, ::testing::Values(64));
INSTANTIATE_TEST_SUITE_P(AnyResolution, GeodesicLegs, ::testing::ValuesIn(kAnyResolutions));

// The built-in character at a modest detail, each resolution bound once for all cases of the suite.
class GeodesicCharacter : public GeodesicBind {
 protected:
  static const tessik::meshes::Character& figure() {
    static const tessik::meshes::Character character = tessik::meshes::character(0.1);
    return character;
  }
  const Bound& boundAt(int resolution) {
    static std::map<int, Bound> bindings;
    auto found = bindings.find(resolution);
    if (found != bindings.end()) return found->second;
    std::vector<Node> nodes;
    for (const auto& b : figure().bones)
      nodes.push_back({b.name.c_str(), b.parentName(), b.position[0], b.position[1], b.position[2]});
    return bindings[resolution] = bind(figure().mesh, nodes, resolution, 4);
  }
};

class GeodesicCharacterAt : public GeodesicCharacter, public ::testing::WithParamInterface<int> {};

TEST_P(GeodesicCharacterAt, EveryVertexLiesInAVoxel) {
  const Bound& bound = boundAt(GetParam());
  ASSERT_EQ(bound.vertexCount, figure().mesh.positions.size());
  const auto orphans = std::count_if(bound.weights.begin(), bound.weights.end(),
                                     [](const auto& weights) { return weights.empty(); });
  EXPECT_EQ(orphans, 0) << "vertices in no voxel";
}

INSTANTIATE_TEST_SUITE_P(AnyResolution, GeodesicCharacterAt, ::testing::ValuesIn(kAnyResolutions));

// Where two bones meet, which of them leads flips with the voxel lattice at any pair of resolutions
// (64 and 128 differ on about 4% of the vertices), so what has to agree is that the bone leading at 100
// still carries at least half of the leading weight at 128.
TEST_F(GeodesicCharacter, BonesLeadingAt100StillLeadAt128) {
  const Bound& fine = boundAt(128);
  const Bound& coarse = boundAt(100);
  ASSERT_EQ(fine.vertexCount, figure().mesh.positions.size());
  ASSERT_EQ(coarse.vertexCount, fine.vertexCount);
  auto weightOf = [](const std::map<std::uint32_t, double>& weights, std::uint32_t bone) {
    const auto found = weights.find(bone);
    return found == weights.end() ? 0.0 : found->second;
  };
  auto byWeight = [](const auto& a, const auto& b) { return a.second < b.second; };
  std::size_t agree = 0;
  for (std::size_t v = 0; v < fine.vertexCount; ++v) {
    if (coarse.weights[v].empty() || fine.weights[v].empty()) continue;
    const auto lead = std::max_element(coarse.weights[v].begin(), coarse.weights[v].end(), byWeight);
    const double most = std::max_element(fine.weights[v].begin(), fine.weights[v].end(), byWeight)->second;
    if (weightOf(fine.weights[v], lead->first) >= 0.5 * most) ++agree;
  }
  EXPECT_GE(static_cast<double>(agree), 0.98 * static_cast<double>(fine.vertexCount));
}

TEST_F(GeodesicBind, ProgressFollowsTheStagesOfACompleteRun) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 4, 8);
  RecordingProgress progress;
  const Bound bound = bind(arm, kArmChain, 16, 4, &progress);
  ASSERT_EQ(bound.vertexCount, arm.positions.size());
  const std::string triangles = std::to_string(arm.triangles.size());
  const std::vector<std::string> expected = {"begin Computing Octree ... " + triangles + ",0",
                                             "setRange 3,0",
                                             "end",
                                             "begin Voxelizing model ... 40,0",
                                             "begin Extracting sparse voxels ... 50,0",
                                             "end",
                                             "begin Identifying Bone Voxels ... 3,0",
                                             "end",
                                             "begin Computing Geodesic Distances ... 3,0",
                                             "end"};
  EXPECT_EQ(progress.calls, expected);
}

// Cancelling at any point leaves no weights, except that weights already computed survive a cancel
// that only reaches smoothing or truncation; the stages still announce themselves.
TEST_F(GeodesicBind, CancellationAtAnyStageGivesTheDocumentedResult) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 4, 8);
  RecordingProgress full;
  bind(arm, kArmChain, 16, 4, &full);
  const int checks = full.checks;
  ASSERT_GT(checks, 10);
  for (int after : {0, 1, checks / 3, checks - 4, checks - 2, checks - 1}) {
    RecordingProgress progress(after);
    testing::internal::CaptureStdout();
    const Bound bound = bind(arm, kArmChain, 16, 4, &progress);
    const std::string report = testing::internal::GetCapturedStdout();
    EXPECT_NE(report.find("Truncate Weights"), std::string::npos) << after;
    EXPECT_NE(report.find("Compute Octree"), std::string::npos) << after;
    if (after < checks - 2) {
      EXPECT_EQ(bound.vertexCount, 0u) << "cancelled after " << after << " of " << checks << " checks";
    } else {
      EXPECT_EQ(bound.vertexCount, arm.positions.size()) << "weights were computed before the cancel";
    }
  }
}

// Every parallel loop of the method runs serialised when called from inside an active OpenMP region, so
// this compares one worker against one per processor, bit for bit.
TEST_F(GeodesicBind, WeightsAreIdenticalForAnyThreadCount) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 20, 12);
  const Bound parallel = bind(arm, kArmChain, 64, 2);
  Bound serial;
#pragma omp parallel num_threads(2)
  {
#pragma omp master
    serial = bind(arm, kArmChain, 64, 2);
  }
  ASSERT_EQ(parallel.vertexCount, arm.positions.size());
  ASSERT_EQ(serial.vertexCount, parallel.vertexCount);
  for (std::size_t v = 0; v < serial.vertexCount; ++v) EXPECT_EQ(serial.weights[v], parallel.weights[v]) << v;
}

// A closed cube at resolution 8: faces at 0.2 and 0.8 fall in cell layers 1 and 6.
class GeodesicGrids : public tessik::test::GLContextTest {};

TEST_F(GeodesicGrids, CubeLabelsPerLevel) {
  const TriMesh cube = tessik::meshes::box({0.2f, 0.2f, 0.2f}, {0.8f, 0.8f, 0.8f});
  MeshData mesh;
  for (const auto& p : cube.positions) mesh.vertices.push_back({{0, 0, 0}, p});
  mesh.triangles = cube.triangles;
  mesh.boundingBox = Collision::AABB(glm::dvec3(-0.00001), glm::dvec3(1.00001));
  ProgressImpl quiet;
  testing::internal::CaptureStdout();
  const auto levels = Algorithm::buildGridsAndLevels(quiet, mesh, 8, false);
  testing::internal::GetCapturedStdout();
  ASSERT_EQ(levels.size(), 4u);
  const auto& finest = levels[3];
  for (int z = 0; z < 8; ++z)
    for (int y = 0; y < 8; ++y)
      for (int x = 0; x < 8; ++x) {
        const int c[3] = {x, y, z};
        bool outside = false, onFace = false;
        for (int k : c) {
          outside = outside || k == 0 || k == 7;
          onFace = onFace || k == 1 || k == 6;
        }
        const int expected = outside ? Algorithm::Empty : onFace ? Algorithm::Boundary : Algorithm::Interior;
        EXPECT_EQ(finest.cells[(z * 8 + y) * 8 + x], expected) << x << "," << y << "," << z;
      }
  for (std::size_t d = 0; d < 3; ++d) {
    EXPECT_EQ(levels[d].dims[0], 1u << d);
    for (auto cell : levels[d].cells) EXPECT_EQ(cell, Algorithm::Interior) << "level " << d;
  }
}

}  // namespace
