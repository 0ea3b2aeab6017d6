#include "pose.h"

#include <array>
#include <functional>
#include <ostream>
#include <stdexcept>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

using namespace tessik::bind;

Mat4 translate(double x, double y, double z) { return {1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, z, 0, 0, 0, 1}; }
// A quarter turn about Y: the joint's own Z axis then points along the mesh's X.
const Mat4 kQuarterTurnY = {0, 0, 1, 0, 0, 1, 0, 0, -1, 0, 0, 0, 0, 0, 0, 1};

void expectNear(const Vec3f& actual, const Vec3f& expected) {
  for (int k = 0; k < 3; ++k) EXPECT_NEAR(actual[k], expected[k], 1e-5f) << "coordinate " << k;
}

// Root at the origin, child one unit up, grandchild two units up.
Skeleton chain(const Mat4& childBind = translate(0, 1, 0)) {
  return {{{"root", -1, translate(0, 0, 0)}, {"child", 0, childBind}, {"grandchild", 1, translate(0, 2, 0)}}};
}

std::vector<Mat4> bindPoses(const Skeleton& skeleton) {
  std::vector<Mat4> poses;
  for (const auto& joint : skeleton.joints) poses.push_back(joint.bindPose);
  return poses;
}

TEST(ParseJointRotation, ReadsBoneAndAngles) {
  const std::vector<std::pair<const char*, JointRotation>> cases = {
      {"l_elbow=0,0,90", {"l_elbow", 0, 0, 90}},
      {"a=b=1.5, -2 ,+3e1", {"a=b", 1.5, -2, 30}},
      {"Bone 1=-.25,0,0", {"Bone 1", -0.25, 0, 0}}};
  for (const auto& [text, expected] : cases) {
    const JointRotation r = parseJointRotation(text);
    EXPECT_EQ(r.joint, expected.joint) << text;
    EXPECT_EQ((std::array<double, 3>{r.rx, r.ry, r.rz}),
              (std::array<double, 3>{expected.rx, expected.ry, expected.rz}))
        << text;
  }
}

TEST(ParseJointRotationBad, ThrowsNamingTheText) {
  for (const char* text :
       {"elbow", "=1,2,3", "elbow=1,2", "elbow=1,2,3,4", "elbow=1,,3", "elbow=1,x,3", "elbow=1,2,3deg",
        "elbow=inf,0,0", "elbow=nan,0,0", "elbow=1e999,0,0", "elbow=1,2,3=", "elbow=+-1,0,0"}) {
    try {
      parseJointRotation(text);
      ADD_FAILURE() << "accepted " << text;
    } catch (const std::invalid_argument& e) {
      EXPECT_NE(std::string(e.what()).find(text), std::string::npos) << e.what();
    }
  }
}

struct PoseCase {
  const char* name;
  std::vector<JointRotation> rotations;
  Vec3f child;
  Vec3f grandchild;
};

void PrintTo(const PoseCase& c, std::ostream* os) { *os << c.name; }

class PosedChain : public ::testing::TestWithParam<PoseCase> {};

TEST_P(PosedChain, MovesJointsBelowTheTurn) {
  const Skeleton skeleton = chain();
  const std::vector<Mat4> posed = posedJointTransforms(skeleton, GetParam().rotations);
  ASSERT_EQ(posed.size(), 3u);
  expectNear(translationOf(posed[0]), {0, 0, 0});
  expectNear(translationOf(posed[1]), GetParam().child);
  expectNear(translationOf(posed[2]), GetParam().grandchild);
  if (GetParam().rotations.empty() || GetParam().rotations[0].joint == "child") {
    EXPECT_EQ(posed[0], skeleton.joints[0].bindPose);
  }
}

INSTANTIATE_TEST_SUITE_P(
    Pose,
    PosedChain,
    ::testing::Values(PoseCase{"NoRotation", {}, {0, 1, 0}, {0, 2, 0}},
                      PoseCase{"ChildZ90", {{"child", 0, 0, 90}}, {0, 1, 0}, {-1, 1, 0}},
                      PoseCase{"ChildX90", {{"child", 90, 0, 0}}, {0, 1, 0}, {0, 1, 1}},
                      PoseCase{"XTurnsBeforeY", {{"child", 90, 90, 0}}, {0, 1, 0}, {1, 1, 0}},
                      PoseCase{
                          "LaterEntryWins", {{"child", 0, 0, 90}, {"child", 90, 0, 0}}, {0, 1, 0}, {0, 1, 1}},
                      PoseCase{"RootCarriesAll", {{"root", 0, 0, 90}}, {-1, 0, 0}, {-2, 0, 0}}),
    [](const ::testing::TestParamInfo<PoseCase>& info) { return std::string(info.param.name); });

TEST(PosedJointTransforms, TurnsAboutTheJointsBindTimeAxes) {
  const std::vector<Mat4> posed =
      posedJointTransforms(chain(multiply(translate(0, 1, 0), kQuarterTurnY)), {{"child", 0, 0, 90}});
  // The child's own Z is the mesh's X, so the grandchild swings toward +Z, not toward -X.
  expectNear(translationOf(posed[2]), {0, 1, 1});
  // The child's X axis, bind-time (0, 0, -1), turns onto its own Y, which is the mesh's Y.
  expectNear(
      {static_cast<float>(posed[1][0]), static_cast<float>(posed[1][4]), static_cast<float>(posed[1][8])},
      {0, 1, 0});
}

TEST(PosedJointTransforms, UnknownBoneThrows) {
  EXPECT_THROW(posedJointTransforms(chain(), {{"elbwo", 0, 0, 90}}), std::invalid_argument);
}

struct SkinInputs {
  Skeleton skeleton = chain();
  SurfaceMesh mesh;
  VertexWeights weights;
};

// Vertices: 0 on the child, 1 half root and half child, 2 the same at quarter weights, 3 unweighted,
// 4 on the child. Triangle 0-3-4 only gives the normals something to do.
class DeformChain : public ::testing::Test {
 protected:
  void SetUp() override {
    in.mesh.positions = {{1, 2, 0}, {1, 1, 0}, {1, 1, 0}, {2, 0, 0}, {0, 3, 0}};
    in.mesh.triangles = {{0, 3, 4}};
    in.weights.offsets = {0, 1, 3, 5, 5, 6};
    in.weights.influences = {{1, 1.0f}, {0, 0.5f}, {1, 0.5f}, {0, 0.25f}, {1, 0.25f}, {1, 1.0f}};
  }

  SurfaceMesh deform(const std::vector<JointRotation>& pose) const {
    return deformMesh(in.mesh, in.skeleton, posedJointTransforms(in.skeleton, pose), in.weights);
  }

  SkinInputs in;
};

TEST_F(DeformChain, BlendsTheJointsMotions) {
  const SurfaceMesh out = deform({{"child", 0, 0, 90}});
  ASSERT_EQ(out.positions.size(), 5u);
  EXPECT_EQ(out.triangles, in.mesh.triangles);
  expectNear(out.positions[0], {-1, 2, 0});       // (1, 1) from the child turns to (-1, 1)
  expectNear(out.positions[1], {0.5f, 1.5f, 0});  // halfway between staying and (0, 2, 0)
  expectNear(out.positions[2], {0.5f, 1.5f, 0});
  EXPECT_EQ(out.positions[3], in.mesh.positions[3]);
  expectNear(out.positions[4], {-2, 1, 0});
}

TEST_F(DeformChain, BindPoseLeavesEveryVertexInPlace) {
  in.skeleton = chain(multiply(translate(0, 1, 0), kQuarterTurnY));
  const SurfaceMesh out = deform({});
  for (std::size_t v = 0; v < in.mesh.positions.size(); ++v)
    expectNear(out.positions[v], in.mesh.positions[v]);
}

TEST_F(DeformChain, RecomputesNormalsFromTheDeformedTriangles) {
  in.mesh.positions = {{1, 1, 0}, {2, 1, 0}, {1, 2, 0}};
  in.mesh.triangles = {{0, 1, 2}};  // faces +Z
  in.weights.offsets = {0, 1, 2, 3};
  in.weights.influences = {{1, 1.0f}, {1, 1.0f}, {1, 1.0f}};
  const SurfaceMesh out = deform({{"child", 90, 0, 0}});
  ASSERT_EQ(out.normals.size(), 3u);
  for (const Vec3f& n : out.normals) expectNear(n, {0, -1, 0});
}

TEST_F(DeformChain, RejectsInputsThatDoNotFit) {
  const std::vector<std::function<void(SkinInputs&)>> breakages = {
      [](SkinInputs& s) {
        s.weights.offsets.pop_back();
        s.weights.influences.pop_back();
      },
      [](SkinInputs& s) { s.weights.influences[0].bone = 3; },
      [](SkinInputs& s) { s.weights.influences[0].weight = -1.0f; },
      [](SkinInputs& s) {
        s.mesh.normals = {{0, 0, 1}};
      },
      [](SkinInputs& s) { s.mesh.triangles[0][1] = 5; },
      [](SkinInputs& s) { s.skeleton.joints.pop_back(); },
  };
  const std::vector<Mat4> poses = bindPoses(in.skeleton);
  for (std::size_t i = 0; i < breakages.size(); ++i) {
    SkinInputs broken = in;
    breakages[i](broken);
    EXPECT_THROW(deformMesh(broken.mesh, broken.skeleton, poses, broken.weights), std::invalid_argument)
        << "breakage " << i;
  }
}

}  // namespace
