#include <cmath>
#include <random>

#include <gtest/gtest.h>

#include <tessik/geom.h>

#include "support/geom_matchers.h"

namespace {

using tessik::test::expectNear;
using TessikSDK::Geom::Inverse;
using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;
using TessikSDK::Geom::RotAngleAxisMatrix;
using TessikSDK::Geom::VectorTransform;

TEST(GeomMatrix, DefaultIsIdentity) {
  const Point3 p(1.5f, -2.0f, 3.25f);
  EXPECT_EQ(p * Matrix3(), p);
  EXPECT_EQ(VectorTransform(Matrix3(), p), p);
}

TEST(GeomMatrix, ProductAppliesLeftOperandFirst) {
  const Matrix3 move = tessik::test::translation(10, 0, 0);
  const Matrix3 quarterTurn = tessik::test::rotateZThenMove(static_cast<float>(M_PI / 2), Point3(0, 0, 0));
  // Move then turn: (1,0,0) -> (11,0,0) -> (0,11,0). Turn then move: (0,1,0) -> (10,1,0).
  expectNear(Point3(1, 0, 0) * (move * quarterTurn), Point3(0, 11, 0));
  expectNear(Point3(1, 0, 0) * (quarterTurn * move), Point3(10, 1, 0));
}

TEST(GeomMatrix, FloatFormIsRowsInOrder) {
  const float f[12] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
  const Matrix3 m = Matrix3::FromFloats(f);
  for (int r = 0; r < 4; ++r) EXPECT_EQ(m.GetRow(r), Point3(f + 3 * r)) << "row " << r;
}

TEST(GeomMatrix, RowMajor4x4MapsPointsAsTheColumnVectorProduct) {
  // A quarter turn about z, then a move by (1, 2, 3): (1, 0, 0) goes to (1, 3, 3).
  const double m[16] = {0, -1, 0, 1, 1, 0, 0, 2, 0, 0, 1, 3, 0, 0, 0, 1};
  const Matrix3 engine = TessikSDK::Geom::Matrix3FromRowMajor4x4(m);
  expectNear(Point3(1, 0, 0) * engine, Point3(1, 3, 3));
  expectNear(Point3(0, 1, 0) * engine, Point3(0, 2, 3));
  expectNear(VectorTransform(engine, Point3(0, 0, 1)), Point3(0, 0, 1));
}

TEST(GeomMatrix, InverseUndoesRandomAffineTransforms) {
  std::mt19937 rng(7);
  for (int i = 0; i < 200; ++i) {
    const Matrix3 m = tessik::test::randomAffine(rng);
    SCOPED_TRACE(i);
    expectNear(m * Inverse(m), Matrix3(), 2e-5f);
    expectNear(Inverse(m) * m, Matrix3(), 2e-5f);
  }
}

TEST(GeomMatrix, SingularInverseIsIdentityNotNaN) {
  const Matrix3 flat(Point3(1, 0, 0), Point3(0, 1, 0), Point3(0, 0, 0), Point3(3, 4, 5));
  tessik::test::expectSame(Inverse(flat), Matrix3());
}

TEST(GeomPoint, NormalizeAndCross) {
  expectNear(Point3(3, 0, 4).Normalize(), Point3(0.6f, 0, 0.8f));
  EXPECT_EQ(Point3(0, 0, 0).Normalize(), Point3(0, 0, 0));
  EXPECT_EQ(Point3(1, 0, 0).CrossProd(Point3(0, 1, 0)), Point3(0, 0, 1));
}

// The spline correction builds its axis as bind-tangent x current-tangent and turns by the positive
// angle between them; the rotation must carry the bind tangent onto the current one, not away from it.
TEST(GeomRotation, CarriesFirstVectorOntoSecondAboutTheirCross) {
  std::mt19937 rng(11);
  std::uniform_real_distribution<float> unit(-1.0f, 1.0f);
  for (int i = 0; i < 500; ++i) {
    const Point3 from = Point3(unit(rng), unit(rng), unit(rng)).Normalize();
    const Point3 to = Point3(unit(rng), unit(rng), unit(rng)).Normalize();
    const float angle = std::acos(TessikSDK::Geom::DotProd(from, to));
    const Matrix3 r = RotAngleAxisMatrix(from.CrossProd(to).Normalize(), angle);
    SCOPED_TRACE(i);
    expectNear(VectorTransform(r, from), to, 1e-4f);
    EXPECT_EQ(r.GetRow(3), Point3(0, 0, 0));
  }
}

TEST(GeomRotation, PreservesLengthsAndAxis) {
  const Point3 axis = Point3(1, 2, 3).Normalize();
  const Matrix3 r = RotAngleAxisMatrix(axis, 1.1f);
  expectNear(axis * r, axis);
  EXPECT_NEAR((Point3(4, -1, 2) * r).Length(), Point3(4, -1, 2).Length(), 1e-5f);
}

TEST(GeomRotation, ZeroAxisTurnsNothing) {
  tessik::test::expectSame(RotAngleAxisMatrix(Point3(0, 0, 0), 1.0f), Matrix3());
}

}  // namespace
