#include "pipeline/weight_quality.h"

#include <cmath>
#include <random>
#include <vector>

#include <gtest/gtest.h>

namespace {

using namespace tessik::bench;
using tessik::bind::Mat4;
using tessik::bind::Skeleton;
using tessik::bind::Vec3f;
using tessik::bind::VertexWeights;

Mat4 at(double x, double y, double z) { return {1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, z, 0, 0, 0, 1}; }

VertexWeights rigid(const std::vector<std::uint32_t>& bones) {
  VertexWeights w;
  for (std::uint32_t b : bones) {
    w.influences.push_back({b, 1.0f});
    w.offsets.push_back(static_cast<std::uint32_t>(w.influences.size()));
  }
  return w;
}

void expectNear(const Vec3d& actual, const Vec3d& expected) {
  for (int k = 0; k < 3; ++k) EXPECT_NEAR(actual[k], expected[k], 1e-12) << "coordinate " << k;
}

const double kQuarter = M_PI / 2.0;

TEST(WeightQuality, OneBoneMovesItsVerticesByItsTurnAboutTheJoint) {
  const Skeleton one{{{"bone", -1, at(1, 2, 3), {}}}};
  const std::vector<Mat4> motion = pose(one, {rotationAbout({0, 0, 1}, kQuarter, {1, 2, 3})});
  const std::vector<Vec3d> moved = skin({{2, 2, 3}, {1, 2, 5}}, rigid({0, 0}), motion);
  expectNear(moved[0], {1, 3, 3});
  expectNear(moved[1], {1, 2, 5});  // on the axis
}

TEST(WeightQuality, AChildTurnsFirstThenFollowsItsParent) {
  const Skeleton chain{{{"upper", -1, at(0, 0, 0), {}}, {"lower", 0, at(1, 0, 0), {}}}};
  const Vec3d z{0, 0, 1};
  const std::vector<Mat4> motion =
      pose(chain, {rotationAbout(z, kQuarter, {0, 0, 0}), rotationAbout(z, kQuarter, {1, 0, 0})});
  const std::vector<Vec3d> moved = skin({{2, 0, 0}, {2, 0, 0}}, rigid({1, 0}), motion);
  expectNear(moved[0], {-1, 1, 0});
  expectNear(moved[1], {0, 2, 0});
  // Half on each bone lands halfway between the two.
  VertexWeights half;
  half.offsets = {0, 2};
  half.influences = {{0, 0.5f}, {1, 0.5f}};
  expectNear(skin({{2, 0, 0}}, half, motion)[0], {-0.5, 1.5, 0});
}

TEST(WeightQuality, RandomPosesAreRigidAndSameWeightsAgreeExactly) {
  const Skeleton chain{{{"a", -1, at(0, 0, 0), {}}, {"b", 0, at(0, 1, 0), {}}, {"c", 1, at(0, 2, 0), {}}}};
  std::mt19937 rng(7);
  std::vector<std::vector<Mat4>> poses;
  for (int i = 0; i < 5; ++i) poses.push_back(randomPose(chain, rng, 25.0));
  const std::vector<Vec3f> points = {{0.1f, 0.5f, 0.0f}, {0.0f, 1.5f, 0.2f}, {0.0f, 2.5f, -0.1f}};
  VertexWeights blend;
  blend.offsets = {0, 2, 4, 5};
  blend.influences = {{0, 0.7f}, {1, 0.3f}, {1, 0.6f}, {2, 0.4f}, {2, 1.0f}};
  for (double e : poseErrors(points, blend, blend, poses, 1.0)) EXPECT_EQ(e, 0.0);
  // Each bone's motion keeps lengths, and every joint stays where its parent carries it.
  for (const std::vector<Mat4>& motion : poses) {
    const std::vector<Vec3d> moved = skin(points, rigid({2, 2, 2}), motion);
    EXPECT_NEAR(distance(moved[0], moved[2]), distance(toDouble(points[0]), toDouble(points[2])), 1e-9);
    expectNear(movedBy(motion[2], {0, 2, 0}), movedBy(motion[1], {0, 2, 0}));
  }
  const std::vector<double> apart = poseErrors(points, blend, rigid({0, 0, 0}), poses, 0.5);
  EXPECT_EQ(apart.size(), 15u);
  EXPECT_GT(mean(apart), 0.0);
}

TEST(WeightQuality, TheBaselineGivesASegmentToTheBoneThatSwingsIt) {
  Skeleton s{{{"hip", -1, at(0, 0, 0), {}}, {"knee", 0, at(0, 1, 0), {}}, {"toe", 1, at(0, 2, 0), {}}}};
  s.joints[2].tip = Vec3f{0.0f, 3.0f, 0.0f};
  const std::vector<Vec3f> points = {{0.1f, 0.5f, 0.0f}, {0.1f, 1.5f, 0.0f}, {0.1f, 2.6f, 0.0f}};
  const VertexWeights w = nearestBoneWeights(points, s);
  ASSERT_EQ(w.numVertices(), 3u);
  for (std::uint32_t v = 0; v < 3; ++v) {
    ASSERT_EQ(w.end(v) - w.begin(v), 1u);
    EXPECT_EQ(w.influences[w.begin(v)].bone, v);
    EXPECT_EQ(w.influences[w.begin(v)].weight, 1.0f);
  }
  // Without its tip the toe is only its joint, where the knee's segment ends: past it, the knee wins.
  s.joints[2].tip.reset();
  EXPECT_EQ(nearestBoneWeights(points, s).influences[2].bone, 1u);
}

TEST(WeightQuality, PercentilesInterpolateBetweenRanks) {
  const std::vector<double> values = {30, 0, 40, 10, 20};
  EXPECT_DOUBLE_EQ(percentile(values, 0.0), 0.0);
  EXPECT_DOUBLE_EQ(percentile(values, 0.5), 20.0);
  EXPECT_DOUBLE_EQ(percentile(values, 0.95), 38.0);
  EXPECT_DOUBLE_EQ(percentile(values, 1.0), 40.0);
  EXPECT_DOUBLE_EQ(mean(values), 20.0);
  EXPECT_TRUE(std::isnan(percentile({}, 0.5)));
}

}  // namespace
