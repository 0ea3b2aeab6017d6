#include <cctype>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

#include <tessik/corvane.h>

#include "deform/corvane_rig.h"
#include "support/geom_matchers.h"

namespace {

using tessik::test::expectSame;
using tessik::test::InspectableCorvane;
using tessik::test::translation;
using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;
using TessikSDK::Util::OutOfRangeException;

class CorvaneSetters : public ::testing::Test {
 protected:
  void SetUp() override {
    engine.SetNumBones(5);
    engine.SetNumPoints(3);
    for (int b = 0; b < 5; ++b) {
      engine.SetInitBoneTM(b, translation(static_cast<float>(b), 0, 0));
      engine.SetBoneTM(b, translation(static_cast<float>(b), 1, 0));
      engine.SetBoneFlags(b, 0x100u + static_cast<unsigned>(b));
    }
    engine.PreComputeBoneXFormTMs();
  }
  InspectableCorvane engine;
};

TEST(CorvaneConstruction, StartsEmptyWithIdentityObjectTransform) {
  InspectableCorvane engine;
  EXPECT_EQ(engine.boneCount(), 0u);
  EXPECT_EQ(engine.pointCount(), 0u);
  EXPECT_FALSE(engine.UseSplineAnimation());
  expectSame(engine.objectTM(), Matrix3());
}

TEST(CorvaneConstruction, NewBonesAndPointsAreBlank) {
  InspectableCorvane engine;
  engine.SetNumBones(2);
  engine.SetNumPoints(2);
  const auto& bone = engine.bone(1);
  expectSame(bone.xFormTM, Matrix3());
  expectSame(bone.initBoneTM, Matrix3());
  expectSame(bone.currentTM, Matrix3());
  EXPECT_EQ(bone.flags, 0u);
  EXPECT_EQ(bone.xFormValid, 0);
  const auto& point = engine.point(1);
  EXPECT_EQ(point.numData, 0);
  EXPECT_EQ(point.boneIDs, nullptr);
  EXPECT_EQ(point.initPositions, nullptr);
  EXPECT_EQ(point.initPositionStride, 0u);
}

TEST_F(CorvaneSetters, SameBoneCountKeepsCachedTransforms) {
  engine.SetNumBones(5);
  for (int b = 0; b < 5; ++b) {
    EXPECT_EQ(engine.bone(b).xFormValid, 1);
    expectSame(engine.bone(b).xFormTM, translation(0, 1, 0));
  }
}

TEST_F(CorvaneSetters, ShrinkThenRegrowResetsOnlyTheReaddedBones) {
  engine.SetNumBones(2);
  EXPECT_EQ(engine.boneCount(), 2u);
  engine.SetNumBones(5);
  for (int b = 0; b < 2; ++b) {
    EXPECT_EQ(engine.bone(b).flags, 0x100u + b);
    EXPECT_EQ(engine.bone(b).xFormValid, 1);
    expectSame(engine.bone(b).currentTM, translation(static_cast<float>(b), 1, 0));
  }
  for (int b = 2; b < 5; ++b) {
    EXPECT_EQ(engine.bone(b).flags, 0u);
    EXPECT_EQ(engine.bone(b).xFormValid, 0);
    expectSame(engine.bone(b).currentTM, Matrix3());
  }
}

TEST_F(CorvaneSetters, GrowingMovesStorageWithoutLosingBones) {
  engine.SetNumBones(200);
  EXPECT_EQ(engine.boneReserve(), 300u);
  expectSame(engine.bone(4).initBoneTM, translation(4, 0, 0));
  EXPECT_EQ(engine.bone(4).xFormValid, 1);
}

TEST_F(CorvaneSetters, TransformSettersInvalidateOnlyTheirBone) {
  engine.SetBoneTM(1, translation(0, 0, 9));
  engine.SetInitBoneTM(3, translation(0, 0, 9));
  engine.SetBoneFlags(0, 0);
  engine.SetInitTM(translation(5, 5, 5));
  for (int b = 0; b < 5; ++b) EXPECT_EQ(engine.bone(b).xFormValid, (b == 1 || b == 3) ? 0 : 1) << b;
}

TEST_F(CorvaneSetters, FloatAndMatrixFormsStoreTheSameRows) {
  float f[12] = {0.f, 1.f, 0.f, -1.f, 0.f, 0.f, 0.f, 0.f, 2.f, 7.f, 8.f, 9.f};
  const Matrix3 m(Point3(0, 1, 0), Point3(-1, 0, 0), Point3(0, 0, 2), Point3(7, 8, 9));
  engine.SetBoneTM(0, f);
  engine.SetBoneTM(1, m);
  engine.SetInitBoneTM(2, f);
  engine.SetInitTM(f);
  expectSame(engine.bone(0).currentTM, engine.bone(1).currentTM);
  expectSame(engine.bone(2).initBoneTM, m);
  expectSame(engine.objectTM(), m);
}

// Each bad call must throw the out-of-range exception with its message and leave the engine as it was.
struct BadCall {
  const char* name;
  void (*call)(InspectableCorvane&);
};

void PrintTo(const BadCall& c, std::ostream* os) { *os << c.name; }

class CorvaneBadIndex : public CorvaneSetters, public ::testing::WithParamInterface<BadCall> {};

TEST_P(CorvaneBadIndex, ThrowsOutOfRangeAndChangesNothing) {
  try {
    GetParam().call(engine);
    FAIL() << GetParam().name << " did not throw";
  } catch (const TessikSDK::Util::Exception& e) {
    EXPECT_NE(dynamic_cast<const OutOfRangeException*>(&e), nullptr);
    EXPECT_STREQ(e.Message(), L"Argument index out of bounds, passed into a TessikSDK::Array::operator[]");
  }
  EXPECT_EQ(engine.boneCount(), 5u);
  EXPECT_EQ(engine.pointCount(), 3u);
  for (int b = 0; b < 5; ++b) {
    EXPECT_EQ(engine.bone(b).xFormValid, 1);
    EXPECT_EQ(engine.bone(b).flags, 0x100u + b);
  }
  EXPECT_EQ(engine.point(2).numData, 0);
}

float gTwelve[12] = {1, 0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 0};

INSTANTIATE_TEST_SUITE_P(
    Corvane,
    CorvaneBadIndex,
    ::testing::Values(
        BadCall{"SetBoneTM(-1)", [](InspectableCorvane& e) { e.SetBoneTM(-1, Matrix3()); }},
        BadCall{"SetBoneTM(5, floats)", [](InspectableCorvane& e) { e.SetBoneTM(5, gTwelve); }},
        BadCall{"SetInitBoneTM(5)", [](InspectableCorvane& e) { e.SetInitBoneTM(5, Matrix3()); }},
        BadCall{"SetInitBoneTM(-3, floats)", [](InspectableCorvane& e) { e.SetInitBoneTM(-3, gTwelve); }},
        BadCall{"SetBoneFlags(5)", [](InspectableCorvane& e) { e.SetBoneFlags(5, 4); }},
        BadCall{"SetPointData(3)",
                [](InspectableCorvane& e) {
                  e.SetPointData(3, 1, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr,
                                 0, nullptr);
                }},
        BadCall{"SetNumBones(-1)", [](InspectableCorvane& e) { e.SetNumBones(-1); }},
        BadCall{"SetNumPoints(-7)", [](InspectableCorvane& e) { e.SetNumPoints(-7); }},
        BadCall{"MapPoint(3)",
                [](InspectableCorvane& e) {
                  float p[3] = {};
                  e.MapPoint(3, p, p);
                }}),
    [](const ::testing::TestParamInfo<BadCall>& info) {
      std::string name;
      for (const char* c = info.param.name; *c; ++c)
        name += std::isalnum(static_cast<unsigned char>(*c)) ? *c : '_';
      return name;
    });

}  // namespace
