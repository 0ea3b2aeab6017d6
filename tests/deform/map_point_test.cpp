#include <cmath>
#include <cstring>
#include <limits>
#include <random>
#include <stdexcept>
#include <vector>

#include <gtest/gtest.h>
#include <tbb/global_control.h>

#include <tessik/corvane.h>

#include "deform/corvane_rig.h"
#include "support/geom_matchers.h"

namespace {

using tessik::test::expectNear;
using tessik::test::Influences;
using tessik::test::InspectableCorvane;
using tessik::test::translation;
using TessikSDK::Geom::Inverse;
using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;
using TessikSDK::Util::OutOfRangeException;

// Bone 0 rests, bone 1 has moved by (10, 0, 0), bone 2 equals bone 1, bone 3 is turned about Z.
class CorvaneMapPoint : public ::testing::Test {
 protected:
  void SetUp() override {
    engine.SetNumBones(4);
    engine.SetNumPoints(1);
    const Matrix3 rest = translation(1, 2, 3);
    for (int b = 0; b < 4; ++b) engine.SetInitBoneTM(b, rest);
    engine.SetBoneTM(0, rest);
    engine.SetBoneTM(1, translation(11, 2, 3));
    engine.SetBoneTM(2, translation(11, 2, 3));
    engine.SetBoneTM(3, rest * tessik::test::rotateZThenMove(0.5f, Point3(0, 0, 0)));
    engine.PreComputeBoneXFormTMs();
  }

  Point3 map(std::vector<int> bones, std::vector<float> weights, Point3 p = Point3(1, 2, 3)) {
    influences = Influences{std::move(bones), std::move(weights)};
    influences.attach(engine, 0);
    float io[3] = {p.x, p.y, p.z};
    engine.MapPoint(0, io, io);  // in and out alias on purpose
    return Point3(io);
  }

  InspectableCorvane engine;
  Influences influences;
};

struct BlendCase {
  const char* name;
  std::vector<int> bones;
  std::vector<float> weights;
  Point3 expected;
};

void PrintTo(const BlendCase& c, std::ostream* os) { *os << c.name; }

class CorvaneBlend : public CorvaneMapPoint, public ::testing::WithParamInterface<BlendCase> {};

TEST_P(CorvaneBlend, MapsOneTwoThree) {
  expectNear(map(GetParam().bones, GetParam().weights), GetParam().expected);
}

const float kNaN = std::numeric_limits<float>::quiet_NaN();

INSTANTIATE_TEST_SUITE_P(
    Corvane,
    CorvaneBlend,
    ::testing::Values(BlendCase{"NoInfluences", {}, {}, {1, 2, 3}},
                      BlendCase{"SingleHalfWeightBlendsTowardTheBone", {1}, {0.5f}, {6, 2, 3}},
                      BlendCase{"SingleZeroWeightStays", {1}, {0.0f}, {1, 2, 3}},
                      BlendCase{"SingleOverweightIsNotClamped", {1}, {2.0f}, {21, 2, 3}},
                      BlendCase{"TinyTotalWeightStays", {1, 2}, {0.000004f, 0.000005f}, {1, 2, 3}},
                      BlendCase{"HalvesOnEqualBonesMoveFully", {1, 2}, {0.5f, 0.5f}, {11, 2, 3}},
                      BlendCase{"WeightsAreNotNormalised", {0, 0}, {0.3f, 0.3f}, {0.6f, 1.2f, 1.8f}},
                      BlendCase{"NaNWeightLeavesThePoint", {1, 2}, {kNaN, 0.5f}, {1, 2, 3}},
                      BlendCase{"ZeroWeightBoneIsNeverRead", {1, 99, -4}, {1.0f, 0.0f, 0.0f}, {11, 2, 3}},
                      BlendCase{"MixesRestAndMoved", {0, 1, 2, 0}, {0.25f, 0.25f, 0.25f, 0.25f}, {6, 2, 3}}),
    [](const ::testing::TestParamInfo<BlendCase>& info) { return std::string(info.param.name); });

TEST_F(CorvaneMapPoint, MatchesBindToCurrentChainThroughTheObjectTransform) {
  const Matrix3 object = tessik::test::rotateZThenMove(0.3f, Point3(4, -1, 2));
  engine.SetInitTM(object);
  engine.PreComputeBoneXFormTMs();
  const Point3 p(0.5f, -0.25f, 2.0f);
  const Matrix3& bind = engine.bone(3).initBoneTM;
  const Matrix3& now = engine.bone(3).currentTM;
  // Object to world at bind time, into bone space, out through the bone's current transform, back.
  const Point3 expected = ((p * object) * Inverse(bind)) * now * Inverse(object);
  expectNear(map({3, 0}, {1.0f, 0.0f}, p), expected);
  expectNear(map({3}, {1.0f}, p), expected);
}

TEST_F(CorvaneMapPoint, RestPoseMapsEveryPointToItself) {
  for (int b = 0; b < 4; ++b) engine.SetBoneTM(b, engine.bone(b).initBoneTM);
  engine.SetInitTM(tessik::test::rotateZThenMove(1.0f, Point3(3, 3, 3)));
  engine.PreComputeBoneXFormTMs();
  for (int b = 0; b < 4; ++b) expectNear(engine.bone(b).xFormTM, Matrix3(), 1e-6f);
  expectNear(map({0, 1, 3}, {0.2f, 0.3f, 0.5f}, Point3(-4, 5, 6)), Point3(-4, 5, 6), 1e-5f);
}

TEST_F(CorvaneMapPoint, StaleBoneThrowsRuntimeErrorAndLeavesOutputAlone) {
  engine.SetBoneTM(1, translation(0, 0, 0));
  for (auto weights : {std::vector<float>{1.0f}, std::vector<float>{0.5f, 0.5f}}) {
    influences = Influences{std::vector<int>(weights.size(), 1), weights};
    influences.attach(engine, 0);
    float in[3] = {1, 2, 3};
    float out[3] = {-7, -7, -7};
    try {
      engine.MapPoint(0, in, out);
      FAIL() << "stale bone accepted";
    } catch (const std::runtime_error& e) {
      EXPECT_STREQ(
          e.what(),
          "TessikSDK::Corvane::CBoneDataClass::GetXFormTM : The CurrentTM matrix has been set after the "
          "XForm computation. Value is invalid now. Remember to call PreComputeXFormTM() before calling "
          "GetXFormTM().");
    }
    EXPECT_EQ(Point3(out), Point3(-7, -7, -7));
  }
  // Points that do not use the stale bone still map, and so does a zero weight on it.
  expectNear(map({2, 1}, {1.0f, 0.0f}), Point3(11, 2, 3));
}

TEST_F(CorvaneMapPoint, ObjectTransformChangeWaitsForPrecompute) {
  engine.SetInitTM(translation(100, 0, 0));
  expectNear(map({1}, {1.0f}), Point3(11, 2, 3));
}

TEST_F(CorvaneMapPoint, BadBoneIndexThrowsOutOfRangeAndLeavesOutputAlone) {
  for (int bad : {4, -1}) {
    for (auto bones : {std::vector<int>{bad}, std::vector<int>{0, bad}}) {
      influences = Influences{bones, std::vector<float>(bones.size(), 0.5f)};
      influences.attach(engine, 0);
      float in[3] = {1, 2, 3};
      float out[3] = {-7, -7, -7};
      EXPECT_THROW(engine.MapPoint(0, in, out), OutOfRangeException);
      EXPECT_EQ(Point3(out), Point3(-7, -7, -7));
    }
  }
}

TEST_F(CorvaneMapPoint, ReadsInterleavedUnalignedStreams) {
  // One packed host record per influence: {int bone; float weight; char tag}, 9 bytes, at odd offsets.
  std::vector<unsigned char> blob(1 + 3 * 9);
  const int ids[3] = {0, 1, 3};
  const float ws[3] = {0.25f, 0.5f, 0.25f};
  for (int j = 0; j < 3; ++j) {
    std::memcpy(&blob[1 + 9 * j], &ids[j], 4);
    std::memcpy(&blob[5 + 9 * j], &ws[j], 4);
  }
  engine.SetPointData(0, 3, 9, reinterpret_cast<int*>(&blob[1]), 9, reinterpret_cast<float*>(&blob[5]), 0,
                      nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr);
  float p[3] = {1, 2, 3};
  float out[3];
  engine.MapPoint(0, p, out);
  const Point3 q = Point3(p) * engine.bone(3).xFormTM;
  expectNear(Point3(out), Point3(0.25f * 1 + 0.5f * 11 + 0.25f * q.x, 0.25f * 2 + 0.5f * 2 + 0.25f * q.y, 3));
}

// A rig of many bones: the cached transforms and the mapped points must be bit-identical whatever the
// number of TBB workers.
TEST(CorvanePrecompute, SameBitsForAnyThreadCount) {
  auto run = [](int threads) {
    tbb::global_control limit(tbb::global_control::max_allowed_parallelism,
                              static_cast<std::size_t>(threads));
    std::mt19937 rng(3);
    InspectableCorvane engine;
    engine.SetNumBones(257);
    engine.SetInitTM(tessik::test::randomAffine(rng));
    for (int b = 0; b < 257; ++b) {
      engine.SetInitBoneTM(b, tessik::test::randomAffine(rng));
      engine.SetBoneTM(b, tessik::test::randomAffine(rng));
    }
    engine.PreComputeBoneXFormTMs();
    std::vector<float> bits;
    for (int b = 0; b < 257; ++b) {
      EXPECT_EQ(engine.bone(b).xFormValid, 1);
      for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 3; ++c) bits.push_back(engine.bone(b).xFormTM.GetRow(r)[c]);
    }
    return bits;
  };
  const std::vector<float> serial = run(1);
  for (int threads : {2, 4, 8}) {
    const std::vector<float> parallel = run(threads);
    ASSERT_EQ(parallel.size(), serial.size());
    EXPECT_EQ(std::memcmp(parallel.data(), serial.data(), serial.size() * sizeof(float)), 0) << threads;
  }
}

}  // namespace
