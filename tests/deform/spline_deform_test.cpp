#include <cmath>
#include <vector>

#include <gtest/gtest.h>

#include <tessik/corvane.h>

#include "deform/corvane_rig.h"
#include "support/geom_matchers.h"

namespace {

using tessik::test::expectNear;
using tessik::test::translation;
using TessikSDK::Corvane::CCorvane;
using TessikSDK::Corvane::SPLINE_BONE_FLAG;
using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;
using TessikSDK::Geom::VectorTransform;

// A host whose curves are a table indexed by curve id: the current attachment position and tangent,
// in the spline bone's space. Records each call so the tests see what the engine asked for.
class CurveHost : public CCorvane {
 public:
  struct Call {
    int bone, curve, piece;
    float u;
  };
  std::vector<Point3> positions, tangents;
  mutable std::vector<Call> calls;

  Point3 GetInterpCurvePiece3D(int bone, int curve, int piece, float u) const override {
    calls.push_back({bone, curve, piece, u});
    return positions.at(curve);
  }
  Point3 GetTangentPiece3D(int, int curve, int, float) const override { return tangents.at(curve); }
  const Matrix3& xForm(int bone) const { return bones[bone].xFormTM; }
};

// Influences whose curve streams are filled; influence j uses curve j.
struct SplineInfluences {
  std::vector<int> bones, curves, pieces;
  std::vector<float> weights, u;
  std::vector<Point3> bindTangents, bindPositions;

  void add(int bone, float weight, Point3 bindPosition, Point3 bindTangent) {
    curves.push_back(static_cast<int>(bones.size()));
    bones.push_back(bone);
    weights.push_back(weight);
    pieces.push_back(10 + static_cast<int>(pieces.size()));
    u.push_back(0.25f * static_cast<float>(u.size() + 1));
    bindPositions.push_back(bindPosition);
    bindTangents.push_back(bindTangent);
  }
  void attach(CCorvane& engine) {
    engine.SetPointData(0, static_cast<int>(bones.size()), sizeof(int), bones.data(), sizeof(float),
                        weights.data(), sizeof(int), curves.data(), sizeof(int), pieces.data(), sizeof(float),
                        u.data(), sizeof(Point3), &bindTangents[0].x, sizeof(Point3), &bindPositions[0].x);
  }
};

// Spline bones 0 and 1 have not moved relative to their bind pose, so the linear blend leaves points
// alone and only the curve correction acts. Bone 2 is an ordinary bone. The object and bone transforms
// are not identities, so every frame change is exercised.
class SplineDeform : public ::testing::Test {
 protected:
  void SetUp() override {
    engine.SetNumBones(3);
    engine.SetNumPoints(1);
    engine.SetInitTM(tessik::test::rotateZThenMove(0.4f, Point3(1, -2, 0.5f)));
    for (int b = 0; b < 3; ++b) {
      const Matrix3 pose = tessik::test::rotateZThenMove(0.7f * static_cast<float>(b + 1), Point3(3, 1, -1));
      engine.SetInitBoneTM(b, pose);
      engine.SetBoneTM(b, pose);
    }
    engine.SetBoneFlags(0, SPLINE_BONE_FLAG | 0x1);
    engine.SetBoneFlags(1, SPLINE_BONE_FLAG);
    engine.SetUseSplineAnimation(true);
    engine.PreComputeBoneXFormTMs();
  }

  // Spline bone space to object space.
  Matrix3 boneToObject(int b) const {
    return TessikSDK::Geom::Inverse(objectTM() * TessikSDK::Geom::Inverse(currentTM(b)));
  }
  Matrix3 objectTM() const { return tessik::test::rotateZThenMove(0.4f, Point3(1, -2, 0.5f)); }
  Matrix3 currentTM(int b) const {
    return tessik::test::rotateZThenMove(0.7f * static_cast<float>(b + 1), Point3(3, 1, -1));
  }

  Point3 map(Point3 p) {
    influences.attach(engine);
    float out[3];
    engine.MapPoint(0, &p.x, out);
    return Point3(out);
  }

  CurveHost engine;
  SplineInfluences influences;
};

TEST_F(SplineDeform, UnchangedCurveLeavesThePoint) {
  for (float w : {1.0f, 0.5f, 0.1f}) {
    influences = {};
    influences.add(0, w, Point3(1, 2, 0), Point3(0, 3, 0));
    influences.add(2, 1.0f - w, Point3(), Point3());
    engine.positions = {Point3(1, 2, 0), Point3()};
    engine.tangents = {Point3(0, 0.5f, 0), Point3()};
    expectNear(map(Point3(4, -1, 2)), Point3(4, -1, 2), 1e-4f);
  }
}

TEST_F(SplineDeform, MovedAttachmentMovesByWeightedDisplacementInObjectSpace) {
  influences.add(0, 0.5f, Point3(1, 2, 0), Point3(1, 0, 0));
  engine.positions = {Point3(1, 2, 0) + Point3(0, 0, 4)};
  engine.tangents = {Point3(2, 0, 0)};
  const Point3 d = VectorTransform(boneToObject(0), Point3(0, 0, 4));
  expectNear(map(Point3(4, -1, 2)), Point3(4, -1, 2) + d * 0.5f, 1e-4f);
  ASSERT_FALSE(engine.calls.empty());
  EXPECT_EQ(engine.calls.back().bone, 0);
  EXPECT_EQ(engine.calls.back().piece, 10);
  EXPECT_FLOAT_EQ(engine.calls.back().u, 0.25f);
}

TEST_F(SplineDeform, TurnedTangentTurnsThePointAboutTheAttachmentByWeightedAngle) {
  // In bone space the tangent turns a quarter about the bone's Z; at weight 0.5 the point turns an
  // eighth about the attachment, in the same sense.
  const Point3 attach(1, 2, 0);
  influences.add(0, 0.5f, attach, Point3(1, 0, 0));
  influences.add(2, 0.5f, Point3(), Point3());
  engine.positions = {attach, Point3()};
  engine.tangents = {Point3(0, 1, 0), Point3()};
  const Matrix3 m = boneToObject(0);
  const Point3 c = attach * m;
  const Point3 axis = VectorTransform(m, Point3(0, 0, 1)).Normalize();
  const Matrix3 eighth = TessikSDK::Geom::RotAngleAxisMatrix(axis, static_cast<float>(M_PI / 4));
  const Point3 p(4, -1, 2);
  expectNear(map(p), c + (p - c) * eighth, 1e-4f);
  // The turn really follows the tangent: the bind tangent at full angle lands on the current one.
  const Matrix3 quarter = TessikSDK::Geom::RotAngleAxisMatrix(axis, static_cast<float>(M_PI / 2));
  expectNear(VectorTransform(quarter, VectorTransform(m, Point3(1, 0, 0))),
             VectorTransform(m, Point3(0, 1, 0)));
}

TEST_F(SplineDeform, OppositeTangentOnlyDisplaces) {
  influences.add(0, 1.0f, Point3(0, 0, 0), Point3(0, 0, 1));
  engine.positions = {Point3(0, 1, 0)};
  engine.tangents = {Point3(0, 0, -1)};
  const Point3 d = VectorTransform(boneToObject(0), Point3(0, 1, 0));
  expectNear(map(Point3(4, -1, 2)), Point3(4, -1, 2) + d, 1e-4f);
}

TEST_F(SplineDeform, SecondSplineInfluenceWorksOnTheFirstOnesOutput) {
  // Influence 0 turns about its attachment, influence 1 then shifts: turning after the shift would
  // land elsewhere.
  influences.add(0, 0.5f, Point3(0, 0, 0), Point3(1, 0, 0));
  influences.add(1, 0.5f, Point3(0, 0, 0), Point3(1, 0, 0));
  engine.positions = {Point3(0, 0, 0), Point3(2, 0, 0)};
  engine.tangents = {Point3(0, 1, 0), Point3(1, 0, 0)};
  const Matrix3 m0 = boneToObject(0);
  const Point3 c0 = Point3(0, 0, 0) * m0;
  const Matrix3 turn = TessikSDK::Geom::RotAngleAxisMatrix(VectorTransform(m0, Point3(0, 0, 1)).Normalize(),
                                                           static_cast<float>(M_PI / 4));
  const Point3 shift = VectorTransform(boneToObject(1), Point3(2, 0, 0)) * 0.5f;
  const Point3 p(4, -1, 2);
  expectNear(map(p), c0 + (p - c0) * turn + shift, 1e-4f);
}

TEST_F(SplineDeform, SingleSplineInfluenceFollowsTheLinearBlend) {
  // The bone has moved too: the curve correction acts on the blended point.
  engine.SetBoneTM(0, currentTM(0) * translation(0, 0, 1));
  engine.PreComputeBoneXFormTMs();
  influences.add(0, 1.0f, Point3(5, 5, 5), Point3(1, 0, 0));
  engine.positions = {Point3(5, 5, 5) + Point3(1, 0, 0)};
  engine.tangents = {Point3(1, 0, 0)};
  const Point3 p(4, -1, 2);
  const Point3 blended = p * engine.xForm(0);
  expectNear(map(p),
             blended + VectorTransform(
                           TessikSDK::Geom::Inverse(
                               objectTM() * TessikSDK::Geom::Inverse(currentTM(0) * translation(0, 0, 1))),
                           Point3(1, 0, 0)),
             1e-4f);
}

TEST_F(SplineDeform, SwitchedOffNeverReadsCurveStreams) {
  engine.SetUseSplineAnimation(false);
  int bones[1] = {0};
  float weights[1] = {1.0f};
  engine.SetPointData(0, 1, sizeof(int), bones, sizeof(float), weights, 0, nullptr, 0, nullptr, 0, nullptr, 0,
                      nullptr, 0, nullptr);
  float p[3] = {4, -1, 2};
  float out[3];
  engine.MapPoint(0, p, out);
  expectNear(Point3(out), Point3(p), 1e-4f);
  EXPECT_TRUE(engine.calls.empty());
}

TEST_F(SplineDeform, ZeroWeightBadBoneFailsOnlyInTheSplinePass) {
  influences.add(2, 1.0f, Point3(), Point3());
  influences.add(7, 0.0f, Point3(), Point3());
  influences.attach(engine);
  float p[3] = {4, -1, 2};
  float out[3] = {-9, -9, -9};
  EXPECT_THROW(engine.MapPoint(0, p, out), TessikSDK::Util::OutOfRangeException);
  EXPECT_EQ(Point3(out), Point3(-9, -9, -9));
  engine.SetUseSplineAnimation(false);
  engine.MapPoint(0, p, out);
  expectNear(Point3(out), Point3(p), 1e-4f);
}

}  // namespace
