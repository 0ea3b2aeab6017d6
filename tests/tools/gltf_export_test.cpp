#include "gltf_export.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <ostream>
#include <random>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "asset.h"
#include "csv_export.h"
#include "tool_outputs.h"

namespace tessik::bind {
namespace {

namespace fs = std::filesystem;

class TempDirTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("tessik_gltf_export_" + std::to_string(std::random_device{}()));
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }
  std::string file(const std::string& name) const { return (dir_ / name).string(); }

  fs::path dir_;
};

tinygltf::Model load(const std::string& path) {
  std::string error;
  tinygltf::Model model = test::loadGltf(path, &error);
  EXPECT_TRUE(error.empty()) << error;
  return model;
}

void expectNear(const Mat4& actual, const Mat4& expected, double tolerance = 1e-5) {
  for (int i = 0; i < 16; ++i) EXPECT_NEAR(actual[i], expected[i], tolerance) << "element " << i;
}

Mat4 trs(const Vec3f& t, double angle, int axis, double scale) {
  const double c = std::cos(angle), s = std::sin(angle);
  const int a = (axis + 1) % 3, b = (axis + 2) % 3;
  Mat4 m = identity();
  m[4 * a + a] = m[4 * b + b] = c;
  m[4 * b + a] = s;
  m[4 * a + b] = -s;
  for (int i = 0; i < 3; ++i) {
    for (int j = 0; j < 3; ++j) m[4 * i + j] *= scale;
    m[4 * i + 3] = t[i];
  }
  return m;
}

struct RigCase {
  const char* name;
  std::vector<int> parents;  // six joints
  double shear;              // on joint 1's bind pose, which no node can hold
};

void PrintTo(const RigCase& c, std::ostream* os) { *os << c.name; }

// Six joints, each turned and moved from its parent, one scaled; six vertices, one influenced by all joints,
// one naming a joint twice, one with a zero and one with a negligible weight, none normalised; one normal
// zero, one too long, one NaN; an odd number of triangles, so short indices end off a 4-byte boundary.
struct Rig {
  SurfaceMesh mesh;
  Skeleton skeleton;
  VertexWeights weights;
};

Rig makeRig(const RigCase& c) {
  Rig rig;
  for (int j = 0; j < 6; ++j) {
    Mat4 local = trs({0.1f * j, 1.0f, -0.2f}, 0.4 + 0.3 * j, j % 3, j == 2 ? 1.5 : 1.0);
    if (j == 1) local = multiply(local, {1, c.shear, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1});
    const int p = c.parents[j];
    rig.skeleton.joints.push_back({j == 3 ? "arm, \"left\"" : "joint" + std::to_string(j), p,
                                   p < 0 ? local : multiply(rig.skeleton.joints[p].bindPose, local)});
  }
  rig.mesh.positions = {{0, 0, 0}, {1, 0, 0}, {1, 1, 0}, {0, 1, 0}, {0.5f, 2, 1}, {-1, 0.5f, 0.25f}};
  rig.mesh.normals = {{0, 0, 1}, {0, 0, 0}, {0, 3, 0}, {1, 0, 0}, {0, 1, 0}, {NAN, 0, 0}};
  rig.mesh.triangles = {{0, 1, 2}, {0, 2, 3}, {3, 2, 4}, {0, 3, 5}, {1, 2, 4}};
  const std::vector<std::vector<Influence>> influences = {
      {{0, 1}, {3, 1e-9f}},
      {{1, 3}, {0, 1}},
      {{2, 0.5f}, {1, 0.3f}, {2, 0.2f}},
      {{5, 0.3f}, {4, 0.2f}, {3, 0.2f}, {2, 0.1f}, {1, 0.1f}, {0, 0.1f}},
      {{5, 1}, {4, 0}},
      {{3, 0.7f}, {4, 0.3f}}};
  for (const auto& list : influences) {
    rig.weights.influences.insert(rig.weights.influences.end(), list.begin(), list.end());
    rig.weights.offsets.push_back(static_cast<std::uint32_t>(rig.weights.influences.size()));
  }
  return rig;
}

class GltfRoundTrip : public TempDirTest, public ::testing::WithParamInterface<std::tuple<RigCase, bool>> {};

TEST_P(GltfRoundTrip, ReadsBackMeshSkeletonAndWeights) {
  const auto& [rigCase, binary] = GetParam();
  const Rig rig = makeRig(rigCase);
  const std::string path = file(binary ? "rig.glb" : "rig.gltf");
  writeSkinnedGltf(path, rig.mesh, rig.skeleton, rig.weights, binary);
  const tinygltf::Model model = load(path);
  ASSERT_EQ(model.meshes.size(), 1u);
  ASSERT_EQ(model.meshes[0].primitives.size(), 1u);
  ASSERT_EQ(model.skins.size(), 1u);
  const tinygltf::Primitive& primitive = model.meshes[0].primitives[0];
  const tinygltf::Skin& skin = model.skins[0];
  const auto attribute = [&](const std::string& name) {
    return primitive.attributes.count(name) ? primitive.attributes.at(name) : -1;
  };

  const std::vector<double> positions = test::readAccessor(model, attribute("POSITION"));
  ASSERT_EQ(positions.size(), 3 * rig.mesh.positions.size());
  for (std::size_t i = 0; i < positions.size(); ++i)
    EXPECT_EQ(positions[i], rig.mesh.positions[i / 3][i % 3]);
  const tinygltf::Accessor& position = model.accessors[attribute("POSITION")];
  EXPECT_EQ(position.minValues, (std::vector<double>{-1, 0, 0}));
  EXPECT_EQ(position.maxValues, (std::vector<double>{1, 2, 1}));
  for (const tinygltf::BufferView& view : model.bufferViews) EXPECT_EQ(view.byteOffset % 4, 0u);
  const std::vector<double> indices = test::readAccessor(model, primitive.indices);
  ASSERT_EQ(indices.size(), 3 * rig.mesh.triangles.size());
  for (std::size_t i = 0; i < indices.size(); ++i) EXPECT_EQ(indices[i], rig.mesh.triangles[i / 3][i % 3]);
  const std::vector<double> normals = test::readAccessor(model, attribute("NORMAL"));
  ASSERT_EQ(normals.size(), positions.size());
  for (std::size_t v = 0; v < rig.mesh.normals.size(); ++v)
    EXPECT_NEAR(std::hypot(normals[3 * v], normals[3 * v + 1], normals[3 * v + 2]), 1.0, 1e-6)
        << "vertex " << v;
  EXPECT_NEAR(normals[7], 1.0, 1e-6) << "the long normal keeps its direction";
  EXPECT_NEAR(normals[15] / normals[17], 0.25, 1e-6) << "the NaN normal follows its one face";

  // Joints: names, hierarchy, and frames that put the mesh in bind pose.
  const auto& joints = rig.skeleton.joints;
  ASSERT_EQ(skin.joints.size(), joints.size());
  const std::vector<double> inverseBinds = test::readAccessor(model, skin.inverseBindMatrices);
  ASSERT_EQ(inverseBinds.size(), 16 * joints.size());
  for (std::size_t j = 0; j < joints.size(); ++j) {
    SCOPED_TRACE(joints[j].name);
    const int node = skin.joints[j];
    EXPECT_EQ(model.nodes[node].name, joints[j].name);
    if (joints[j].parent >= 0) {
      EXPECT_EQ(test::parentNode(model, node), skin.joints[joints[j].parent]);
    }
    int ancestor = node;  // glTF wants skin.skeleton above every joint
    while (ancestor >= 0 && ancestor != skin.skeleton) ancestor = test::parentNode(model, ancestor);
    EXPECT_EQ(ancestor, skin.skeleton);
    const Mat4 world = test::nodeWorld(model, node), inverseBind = test::columnMajor(inverseBinds, 16 * j);
    expectNear(multiply(world, inverseBind), identity());
    for (int k : {3, 7, 11}) EXPECT_NEAR(world[k], joints[j].bindPose[k], 1e-5);
    if (rigCase.shear == 0.0) expectNear(inverseBind, inverse(joints[j].bindPose));
  }

  // Weights: every influence back, normalised, at most one slot per joint.
  std::vector<std::map<int, double>> read(rig.mesh.positions.size());
  int sets = 0;
  for (; attribute("JOINTS_" + std::to_string(sets)) >= 0; ++sets) {
    const int jointsAccessor = attribute("JOINTS_" + std::to_string(sets));
    EXPECT_EQ(model.accessors[jointsAccessor].componentType, TINYGLTF_COMPONENT_TYPE_UNSIGNED_BYTE);
    const std::vector<double> jointValues = test::readAccessor(model, jointsAccessor);
    const std::vector<double> weightValues =
        test::readAccessor(model, attribute("WEIGHTS_" + std::to_string(sets)));
    ASSERT_EQ(jointValues.size(), 4 * read.size());
    ASSERT_EQ(weightValues.size(), 4 * read.size());
    for (std::size_t i = 0; i < jointValues.size(); ++i) {
      EXPECT_LT(jointValues[i], joints.size());
      if (weightValues[i] == 0.0) {
        EXPECT_EQ(jointValues[i], 0.0) << "an empty slot names a joint";
        continue;
      }
      EXPECT_EQ(read[i / 4].count(int(jointValues[i])), 0u) << "joint named twice";
      read[i / 4][int(jointValues[i])] = weightValues[i];
    }
  }
  EXPECT_EQ(sets, 2) << "six influences need two sets";
  for (std::size_t v = 0; v < read.size(); ++v) {
    std::map<int, double> expected;
    double total = 0.0, sum = 0.0;
    for (std::uint32_t i = rig.weights.begin(v); i < rig.weights.end(v); ++i) {
      expected[rig.weights.influences[i].bone] += rig.weights.influences[i].weight;
      total += rig.weights.influences[i].weight;
    }
    // Vertices 0 and 4 each have one influence too light to keep.
    EXPECT_EQ(read[v].size() + (v == 0 || v == 4), expected.size()) << "vertex " << v;
    for (const auto& [joint, weight] : read[v]) sum += weight;
    EXPECT_NEAR(sum, 1.0, 1e-5) << "vertex " << v;
    for (const auto& [joint, weight] : expected)
      EXPECT_NEAR(read[v][joint], weight / total, 1e-6) << "vertex " << v << " joint " << joint;
  }
}

INSTANTIATE_TEST_SUITE_P(Rigs,
                         GltfRoundTrip,
                         ::testing::Combine(::testing::Values(RigCase{"chain", {-1, 0, 1, 2, 3, 4}, 0.0},
                                                              RigCase{"two_roots", {-1, 0, 0, -1, 3, 3}, 0.0},
                                                              RigCase{"sheared", {-1, 0, 1, 1, 0, 4}, 0.4}),
                                            ::testing::Bool()),
                         [](const auto& info) {
                           return std::string(std::get<0>(info.param).name) +
                                  (std::get<1>(info.param) ? "_glb" : "_gltf");
                         });

using GltfExport = TempDirTest;

TEST_F(GltfExport, ManyJointsTakeShortJointIndices) {
  Rig rig;
  for (int j = 0; j < 300; ++j)
    rig.skeleton.joints.push_back({"j" + std::to_string(j), j - 1, trs({0, 0.1f * j, 0}, 0, 0, 1)});
  rig.mesh.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}};
  rig.mesh.triangles = {{0, 1, 2}};
  rig.weights.influences = {{299, 1}, {256, 1}, {0, 1}};
  rig.weights.offsets = {0, 1, 2, 3};
  const std::string path = file("many.glb");
  writeSkinnedGltf(path, rig.mesh, rig.skeleton, rig.weights, true);
  const tinygltf::Model model = load(path);
  const int joints = model.meshes.at(0).primitives.at(0).attributes.at("JOINTS_0");
  EXPECT_EQ(model.accessors[joints].componentType, TINYGLTF_COMPONENT_TYPE_UNSIGNED_SHORT);
  const std::vector<double> values = test::readAccessor(model, joints);
  ASSERT_EQ(values.size(), 12u);
  EXPECT_EQ(values[0], 299);
  EXPECT_EQ(values[4], 256);
}

TEST_F(GltfExport, RefusesBrokenInputWithoutWritingAFile) {
  const Rig good = makeRig({"chain", {-1, 0, 1, 2, 3, 4}, 0.0});
  std::vector<std::pair<const char*, Rig>> cases(4, {"", good});
  cases[0].first = "vertex without influence";
  auto& unweighted = cases[0].second.weights;
  const std::uint32_t first = unweighted.end(0);
  unweighted.influences.erase(unweighted.influences.begin(), unweighted.influences.begin() + first);
  for (std::uint32_t& offset : unweighted.offsets) offset -= std::min(offset, first);
  cases[1].first = "joint out of range";
  cases[1].second.weights.influences[0].bone = 6;
  cases[2].first = "weights for fewer vertices";
  cases[2].second.mesh.positions.push_back({0, 0, 0});
  cases[2].second.mesh.normals.push_back({0, 0, 1});
  cases[3].first = "triangle index out of range";
  cases[3].second.mesh.triangles.push_back({0, 1, 6});
  for (const auto& [name, rig] : cases)
    for (bool binary : {false, true}) {
      const std::string path = file(binary ? "bad.glb" : "bad.gltf");
      EXPECT_THROW(writeSkinnedGltf(path, rig.mesh, rig.skeleton, rig.weights, binary), std::invalid_argument)
          << name;
      EXPECT_FALSE(fs::exists(path)) << name;
    }
}

using CsvExport = TempDirTest;

TEST_F(CsvExport, ListsEveryInfluenceByQuotedName) {
  Skeleton skeleton;
  skeleton.joints = {{"root", -1, identity()}, {"arm, \"left\"", 0, identity()}};
  VertexWeights weights;
  weights.influences = {{0, 1}, {1, 0.75}, {0, 0.1}};
  weights.offsets = {0, 1, 1, 3};
  const std::string path = file("w.csv");
  writeWeightsCsv(path, skeleton, weights);
  std::stringstream text;
  text << std::ifstream(path).rdbuf();
  EXPECT_EQ(text.str(), "vertex,bone,weight\n0,root,1\n2,\"arm, \"\"left\"\"\",0.75\n2,root,0.1\n");

  weights.influences[2].bone = 2;
  EXPECT_THROW(writeWeightsCsv(file("bad.csv"), skeleton, weights), std::invalid_argument);
  EXPECT_FALSE(fs::exists(file("bad.csv")));
}

}  // namespace
}  // namespace tessik::bind
