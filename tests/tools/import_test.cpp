#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include <gtest/gtest.h>
#include <tiny_gltf.h>
#include <unistd.h>

#include "asset_import.h"
#include "gltf_export.h"

namespace tessik::bind {
namespace {

namespace fs = std::filesystem;

class ImportTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("tessik_import_" + std::to_string(::getpid()));
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }

  std::string write(const std::string& name, const std::string& text) {
    const fs::path p = dir_ / name;
    std::ofstream(p, std::ios::binary) << text;
    return p.string();
  }

  static std::string model(const char* relative) {
    const std::string path = std::string(TESSIK_ASSIMP_MODELS) + "/" + relative;
    if (!fs::exists(path))
      ADD_FAILURE() << path << " is missing: scripts/install_deps.sh installs assimp-testmodels";
    return path;
  }

  fs::path dir_;
};

void expectParentsFirst(const Skeleton& s) {
  for (std::size_t j = 0; j < s.joints.size(); ++j)
    EXPECT_LT(s.joints[j].parent, static_cast<int>(j)) << s.joints[j].name;
}

TEST_F(ImportTest, SkinnedCharactersBringTheirBonesInBindPose) {
  struct Case {
    const char* file;
    std::size_t bones;
    std::size_t meshes;
    long roots;  // separate bone chains, as the files have them
  };
  for (const Case c : {Case{"X/Testwuson.X", 37, 1, 2}, Case{"X/BCN_Epileptic.X", 54, 3, 1},
                       Case{"FBX/animation_with_skeleton.fbx", 14, 1, 2}}) {
    SCOPED_TRACE(c.file);
    const ImportedAsset a = importAsset(model(c.file), false);
    EXPECT_EQ(a.skeleton.joints.size(), c.bones);
    EXPECT_EQ(a.meshesMerged, c.meshes);
    EXPECT_EQ(a.mesh.normals.size(), a.mesh.positions.size());
    expectParentsFirst(a.skeleton);
    // A bone whose parent node is not a bone starts a chain; bones further down must not be cut off.
    EXPECT_EQ(std::count_if(a.skeleton.joints.begin(), a.skeleton.joints.end(),
                            [](const Joint& j) { return j.parent < 0; }),
              c.roots);
  }
}

TEST_F(ImportTest, GltfRoundTripKeepsSkeletonAndSpace) {
  // A rotated, offset two-bone rig: the bind poses must come back as the inverse of the offset matrices
  // in the mesh's own space, whatever the node transforms.
  Skeleton s;
  Mat4 root = identity();
  root[3] = 1.0;
  root[7] = 2.0;
  Mat4 tip = {0, -1, 0, 1, 1, 0, 0, 3, 0, 0, 1, 0, 0, 0, 0, 1};
  s.joints = {{"root", -1, root, {}}, {"tip", 0, tip, {}}};
  SurfaceMesh m;
  m.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {0, 0, 1}};
  m.triangles = {{0, 2, 1}, {0, 1, 3}, {0, 3, 2}, {1, 2, 3}};
  VertexWeights w;
  w.offsets = {0, 1, 2, 4, 5};
  w.influences = {{0, 1.0f}, {1, 1.0f}, {0, 0.5f}, {1, 0.5f}, {1, 1.0f}};
  const std::string path = (dir_ / "rig.glb").string();
  writeSkinnedGltf(path, m, s, w, true);

  const ImportedAsset a = importAsset(path, false);
  ASSERT_EQ(a.skeleton.joints.size(), 2u);
  EXPECT_EQ(a.skeleton.joints[0].name, "root");
  EXPECT_EQ(a.skeleton.joints[1].name, "tip");
  EXPECT_EQ(a.skeleton.joints[1].parent, 0);
  for (std::size_t j = 0; j < 2; ++j)
    for (int k = 0; k < 16; ++k)
      EXPECT_NEAR(a.skeleton.joints[j].bindPose[k], s.joints[j].bindPose[k], 1e-5) << j << "," << k;
  ASSERT_EQ(a.mesh.triangles.size(), 4u);
  for (const Vec3f& p : a.mesh.positions)
    EXPECT_NE(std::find(m.positions.begin(), m.positions.end(), p), m.positions.end());

  // The same file with a --skeleton: the file's bones are ignored and the mesh is still read.
  EXPECT_TRUE(importAsset(path, true).skeleton.joints.empty());
}

double distance(const Vec3f& a, const Vec3f& b) { return std::hypot(a[0] - b[0], a[1] - b[1], a[2] - b[2]); }

TEST_F(ImportTest, FileWeightsGiveEveryMergedVertexItsOwnBones) {
  // BCN_Epileptic merges three meshes: their weights must land on their own stretch of vertices.
  for (const char* file : {"X/Testwuson.X", "X/BCN_Epileptic.X", "FBX/animation_with_skeleton.fbx"}) {
    SCOPED_TRACE(file);
    const ImportedAsset a = importAsset(model(file), false);
    ASSERT_TRUE(a.fileWeights.has_value());
    const VertexWeights& w = *a.fileWeights;
    ASSERT_EQ(w.numVertices(), a.mesh.positions.size());
    for (std::size_t v = 0; v < w.numVertices(); ++v) {
      ASSERT_GT(w.end(v), w.begin(v)) << "vertex " << v << " lost its weights";
      float sum = 0.0f;
      for (std::uint32_t i = w.begin(v); i < w.end(v); ++i) {
        ASSERT_LT(w.influences[i].bone, a.skeleton.joints.size());
        if (i > w.begin(v)) {
          EXPECT_GE(w.influences[i - 1].weight, w.influences[i].weight);
        }
        sum += w.influences[i].weight;
      }
      EXPECT_NEAR(sum, 1.0f, 1e-5f) << "vertex " << v;
    }
  }
  EXPECT_FALSE(importAsset(model("X/Testwuson.X"), true).fileWeights.has_value());
}

TEST_F(ImportTest, GltfEndNodesAndWeightsComeBackInBindSpace) {
  // The leaf's frame is turned a quarter about z, so an end node one half along its local x lies one half
  // along mesh y; a nearer end node and one on the joint itself must not win.
  Skeleton s;
  Mat4 root = identity(), leaf = {0, -1, 0, 1, 1, 0, 0, 3, 0, 0, 1, 0, 0, 0, 0, 1}, flat = identity();
  root[3] = 1.0, root[7] = 2.0, flat[3] = 2.0, flat[7] = 2.0;
  s.joints = {{"root", -1, root, {}}, {"leaf", 0, leaf, {}}, {"flat", 0, flat, {}}};
  SurfaceMesh m;
  m.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {0, 0, 1}};
  m.triangles = {{0, 2, 1}, {0, 1, 3}, {0, 3, 2}, {1, 2, 3}};
  VertexWeights w;
  w.offsets = {0, 1, 3, 6, 7};
  w.influences = {{0, 1.0f}, {1, 0.75f}, {0, 0.25f}, {2, 0.5f}, {1, 0.3f}, {0, 0.2f}, {2, 1.0f}};
  const std::string path = (dir_ / "ends.glb").string();
  writeSkinnedGltf(path, m, s, w, true);

  tinygltf::Model gltf;
  tinygltf::TinyGLTF io;
  std::string err, warn;
  ASSERT_TRUE(io.LoadBinaryFromFile(&gltf, &err, &warn, path)) << err;
  const auto addEnd = [&](const std::string& under, const char* name, std::vector<double> at) {
    const auto parent = std::find_if(gltf.nodes.begin(), gltf.nodes.end(),
                                     [&](const tinygltf::Node& n) { return n.name == under; });
    ASSERT_NE(parent, gltf.nodes.end()) << under;
    parent->children.push_back(static_cast<int>(gltf.nodes.size()));
    tinygltf::Node end;
    end.name = name;
    end.translation = std::move(at);
    gltf.nodes.push_back(end);
  };
  addEnd("leaf", "leaf_nub", {0.2, 0.0, 0.0});
  addEnd("leaf", "leaf_end", {0.5, 0.0, 0.0});
  addEnd("flat", "flat_end", {0.0, 0.0, 0.0});
  addEnd("root", "root_helper", {0.0, 0.0, 4.0});  // not a leaf: its bone ends at its children
  ASSERT_TRUE(io.WriteGltfSceneToFile(&gltf, path, true, true, false, true));

  const ImportedAsset a = importAsset(path, false);
  ASSERT_EQ(a.skeleton.joints.size(), 3u);
  EXPECT_FALSE(a.skeleton.joints[0].tip.has_value());
  ASSERT_TRUE(a.skeleton.joints[1].tip.has_value());
  EXPECT_LT(distance(*a.skeleton.joints[1].tip, {1.0f, 3.5f, 0.0f}), 1e-5);
  EXPECT_FALSE(a.skeleton.joints[2].tip.has_value());

  ASSERT_TRUE(a.fileWeights.has_value());
  ASSERT_EQ(a.fileWeights->numVertices(), m.positions.size());
  for (std::size_t v = 0; v < m.positions.size(); ++v) {
    const std::size_t was =
        std::find(m.positions.begin(), m.positions.end(), a.mesh.positions[v]) - m.positions.begin();
    ASSERT_LT(was, m.positions.size());
    ASSERT_EQ(a.fileWeights->end(v) - a.fileWeights->begin(v), w.end(was) - w.begin(was)) << v;
    for (std::uint32_t i = 0; i < w.end(was) - w.begin(was); ++i) {
      const Influence got = a.fileWeights->influences[a.fileWeights->begin(v) + i],
                      want = w.influences[w.begin(was) + i];
      EXPECT_EQ(got.bone, want.bone) << v;
      EXPECT_NEAR(got.weight, want.weight, 1e-6f) << v;
    }
  }
}

TEST_F(ImportTest, StaticMeshHasNoSkeletonAndKeepsItsTriangles) {
  const ImportedAsset a =
      importAsset(write("quad.obj", "v 0 0 0\nv 1 0 0\nv 1 1 0\nv 0 1 0\nf 1 2 3 4\n"), false);
  EXPECT_TRUE(a.skeleton.joints.empty());
  EXPECT_EQ(a.mesh.triangles.size(), 2u);
}

TEST_F(ImportTest, BadInputsFailWithOneLineNamingTheFile) {
  const std::string missing = (dir_ / "missing.fbx").string();
  const std::string garbage = write("garbage.fbx", "this is not an FBX file at all\n");
  const std::string lines = write("lines.obj", "v 0 0 0\nv 1 0 0\nv 1 1 0\nl 1 2 3\n");
  for (const auto& [path, text] : {std::pair{missing, "No such file"}, std::pair{dir_.string(), "directory"},
                                   std::pair{garbage, "cannot import"}, std::pair{lines, "no triangles"}}) {
    try {
      importAsset(path, false);
      ADD_FAILURE() << "accepted " << path;
    } catch (const std::runtime_error& e) {
      const std::string what = e.what();
      EXPECT_NE(what.find(path), std::string::npos) << what;
      EXPECT_NE(what.find(text), std::string::npos) << what;
      EXPECT_EQ(what.find('\n'), std::string::npos) << what;
      EXPECT_LE(what.size(), path.size() + 240) << what;
    }
  }
}

}  // namespace
}  // namespace tessik::bind
