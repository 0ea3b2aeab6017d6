#include <algorithm>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include <gtest/gtest.h>
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
  s.joints = {{"root", -1, root}, {"tip", 0, tip}};
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
    }
  }
}

}  // namespace
}  // namespace tessik::bind
