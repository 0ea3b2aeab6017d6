#include "pipeline/leaf_tips.h"

#include <gtest/gtest.h>

#include "meshes/mesh_builders.h"
#include "pipeline/bones.h"

namespace TessikSDK::Pipeline {
namespace {

Mesh toMesh(const tessik::meshes::TriMesh& m) { return {m.positions, m.triangles}; }

// Joints just off the tube's axis, so that casts along it cross faces rather than the caps' centres.
Bone boneAt(const char* name, int parent, double x, double y = 0.02, double z = 0.01) {
  return Pipeline::boneAt(name, parent, x, y, z);
}

// A tube along x from 0 to 3 around the x axis.
Mesh tube() { return toMesh(tessik::meshes::cylinderX(0.0f, 3.0f, 0.0f, 0.0f, 0.3f, 12, 16)); }

struct TipCase {
  const char* name;
  double parentX, leafX;
  bool expectTip;
  double expectX;      // where the tip lands along the tube
  double otherX = -1;  // a second root's joint, when positive
};

class LeafTipPlacement : public ::testing::TestWithParam<TipCase> {};

TEST_P(LeafTipPlacement, CastsAwayFromTheParentToJustInsideTheSurface) {
  const TipCase& c = GetParam();
  std::vector<Bone> bones = {boneAt("parent", -1, c.parentX), boneAt("leaf", 0, c.leafX)};
  if (c.otherX > 0.0) bones.push_back(boneAt("other", -1, c.otherX));
  const TipPlacement placed = placeLeafTips(tube(), bones);
  ASSERT_EQ(placed.tips.size(), c.expectTip ? 1u : 0u);
  EXPECT_EQ(placed.leavesWithoutTip, c.expectTip ? 0u : 1u);
  if (!c.expectTip) return;
  EXPECT_EQ(placed.tips[0].leaf, 1u);
  EXPECT_FALSE(placed.tips[0].fromSkeleton);
  EXPECT_NEAR(placed.tips[0].position[0], c.expectX, 1e-6);
  EXPECT_NEAR(placed.tips[0].position[1], 0.02, 1e-9) << "the tip continues the parent's direction";
}

INSTANTIATE_TEST_SUITE_P(Cases,
                         LeafTipPlacement,
                         ::testing::Values(
                             // 0.9 of the way from the joint at 1.5 to the end cap at 3.
                             TipCase{"ReachesTowardTheEnd", 0.2, 1.5, true, 1.5 + 0.9 * 1.5},
                             // A parent only 0.2 long: the tip may run at most 2.5 parent lengths.
                             TipCase{"CappedByTheParentLength", 1.3, 1.5, true, 1.5 + 2.5 * 0.2},
                             // Pointing back toward x = 0: the cast runs the other way.
                             TipCase{"FollowsTheParentDirection", 2.5, 1.0, true, 1.0 - 0.9 * 1.0},
                             // The leaf joint in the air past the end: no ray to cast from.
                             TipCase{"NoneWhenTheJointIsOutside", 2.0, 3.4, false, 0.0}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(LeafTips, ClothingOverTheJointIsLeftBeforeTheTipStops) {
  // A sleeve around the middle of the tube: the joint is inside both, and the cast must come out of the
  // body too, not stop where it leaves the sleeve at x = 2.
  tessik::meshes::TriMesh m = tessik::meshes::cylinderX(0.0f, 3.0f, 0.0f, 0.0f, 0.3f, 12, 16);
  m.append(tessik::meshes::cylinderX(1.0f, 2.0f, 0.0f, 0.0f, 0.4f, 4, 16));
  const TipPlacement placed = placeLeafTips(toMesh(m), {boneAt("parent", -1, 0.2), boneAt("leaf", 0, 1.5)});
  ASSERT_EQ(placed.tips.size(), 1u);
  EXPECT_NEAR(placed.tips[0].position[0], 1.5 + 0.9 * 1.5, 1e-6);
}

TEST(LeafTips, SkeletonTipsWinAndOnlyLeavesGetTips) {
  std::vector<Bone> bones = {boneAt("root", -1, 0.2), boneAt("mid", 0, 1.0), boneAt("leaf", 1, 1.5),
                             boneAt("lone", -1, 0.1, -0.2)};
  bones[2].hasTip = true;
  bones[2].tip = {2.5, 0.1, 0.0};
  TipPlacement placed = placeLeafTips(tube(), bones);
  ASSERT_EQ(placed.tips.size(), 1u);
  EXPECT_EQ(placed.tips[0].leaf, 2u);
  EXPECT_TRUE(placed.tips[0].fromSkeleton);
  EXPECT_EQ(placed.tips[0].position, (std::array<double, 3>{2.5, 0.1, 0.0}));
  EXPECT_EQ(placed.leavesWithoutTip, 1u) << "a root with no children has no direction to cast in";

  // An end the file puts past the surface is pulled back inside, along the same line.
  bones[2].tip = {3.5, 0.02, 0.01};
  placed = placeLeafTips(tube(), bones);
  ASSERT_EQ(placed.tips.size(), 1u);
  EXPECT_NEAR(placed.tips[0].position[0], 1.5 + 0.9 * 1.5, 1e-6);
}

TEST(LeafTips, WindingNumberTellsInsideFromOutside) {
  const Mesh box = toMesh(tessik::meshes::box({0, 0, 0}, {1, 1, 1}));
  EXPECT_NEAR(windingNumber(box, {0.5, 0.5, 0.5}), 1.0, 1e-9);
  EXPECT_NEAR(windingNumber(box, {1.5, 0.5, 0.5}), 0.0, 1e-9);
  Mesh inverted = box;
  for (auto& t : inverted.triangles) std::swap(t[1], t[2]);
  EXPECT_NEAR(windingNumber(inverted, {0.5, 0.5, 0.5}), -1.0, 1e-9);
}

}  // namespace
}  // namespace TessikSDK::Pipeline
