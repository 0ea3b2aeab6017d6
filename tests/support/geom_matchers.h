#pragma once

#include <cmath>
#include <random>

#include <gtest/gtest.h>

#include <tessik/geom.h>

namespace tessik::test {

using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;

inline void expectNear(const Point3& actual, const Point3& expected, float tolerance = 1e-5f) {
  EXPECT_NEAR(actual.x, expected.x, tolerance);
  EXPECT_NEAR(actual.y, expected.y, tolerance);
  EXPECT_NEAR(actual.z, expected.z, tolerance);
}

inline void expectNear(const Matrix3& actual, const Matrix3& expected, float tolerance = 1e-5f) {
  for (int r = 0; r < 4; ++r) {
    SCOPED_TRACE(::testing::Message() << "row " << r);
    expectNear(actual.GetRow(r), expected.GetRow(r), tolerance);
  }
}

inline void expectSame(const Matrix3& actual, const Matrix3& expected) {
  for (int r = 0; r < 4; ++r) {
    EXPECT_EQ(actual.GetRow(r), expected.GetRow(r)) << "row " << r;
  }
}

inline Matrix3 translation(float x, float y, float z) {
  return Matrix3(Point3(1, 0, 0), Point3(0, 1, 0), Point3(0, 0, 1), Point3(x, y, z));
}

// Rotation about Z by `radians`, then a move: a typical rigid bone transform.
inline Matrix3 rotateZThenMove(float radians, const Point3& move) {
  const float c = std::cos(radians), s = std::sin(radians);
  return Matrix3(Point3(c, s, 0), Point3(-s, c, 0), Point3(0, 0, 1), move);
}

// A well-conditioned affine matrix: a rotation scaled by [0.5, 2] plus a shear and a translation.
inline Matrix3 randomAffine(std::mt19937& rng) {
  std::uniform_real_distribution<float> unit(-1.0f, 1.0f);
  std::uniform_real_distribution<float> scale(0.5f, 2.0f);
  const Point3 axis = Point3(unit(rng), unit(rng), unit(rng) + 2.0f).Normalize();
  const Matrix3 rotation = TessikSDK::Geom::RotAngleAxisMatrix(axis, unit(rng) * 3.0f);
  const Matrix3 stretch(Point3(scale(rng), 0.1f * unit(rng), 0), Point3(0, scale(rng), 0.1f * unit(rng)),
                        Point3(0, 0, scale(rng)), Point3(4 * unit(rng), 4 * unit(rng), 4 * unit(rng)));
  return rotation * stretch;
}

}  // namespace tessik::test
