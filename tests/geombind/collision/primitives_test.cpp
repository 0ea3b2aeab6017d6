#include "geombind/collision/primitives.h"

#include <cmath>
#include <limits>

#include <gtest/gtest.h>

namespace {

using TessikSDK::GeomBind::Collision::AABB;
using TessikSDK::GeomBind::Collision::Triangle;

constexpr double kMax = 1.7976931348623157e308;

TEST(CollisionBox, DefaultIsEmptyAndOneExtendMakesAPoint) {
  AABB box;
  EXPECT_EQ(box.lower, glm::dvec3(kMax));
  EXPECT_EQ(box.upper, glm::dvec3(-kMax));
  box.extend({1, -2, 3});
  EXPECT_EQ(box.lower, glm::dvec3(1, -2, 3));
  EXPECT_EQ(box.upper, glm::dvec3(1, -2, 3));
  box.extend({-1, 5, 3});
  EXPECT_EQ(box.lower, glm::dvec3(-1, -2, 3));
  EXPECT_EQ(box.upper, glm::dvec3(1, 5, 3));
}

TEST(CollisionBox, CornersAreKeptAsGiven) {
  const AABB box({1, 1, 1}, {0, 0, 0});
  EXPECT_EQ(box.lower, glm::dvec3(1));
  EXPECT_EQ(box.upper, glm::dvec3(0));
}

TEST(CollisionBox, OfTriangleSpansItsVertices) {
  const AABB box(Triangle({0, 5, 1}, {2, -1, 1}, {1, 0, 4}));
  EXPECT_EQ(box.lower, glm::dvec3(0, -1, 1));
  EXPECT_EQ(box.upper, glm::dvec3(2, 5, 4));
  const AABB point(Triangle({3, 3, 3}, {3, 3, 3}, {3, 3, 3}));
  EXPECT_EQ(point.lower, point.upper);
}

struct InflateCase {
  const char* name;
  AABB box;
  glm::dvec3 lower, upper;
};

void PrintTo(const InflateCase& c, std::ostream* os) { *os << c.name; }

class CollisionInflate : public ::testing::TestWithParam<InflateCase> {};

TEST_P(CollisionInflate, PadsOnlyZeroWidthAxes) {
  AABB box = GetParam().box;
  box.inflateFlatAxes();
  EXPECT_EQ(box.lower, GetParam().lower);
  EXPECT_EQ(box.upper, GetParam().upper);
}

// The pad is the diagonal times 0.1f, rounded to float: 0.2 becomes 0.20000000298023224.
const double kPadOfTwo = static_cast<double>(0.2f);

INSTANTIATE_TEST_SUITE_P(
    Collision,
    CollisionInflate,
    ::testing::Values(InflateCase{"line_along_x",
                                  AABB({0, 1, 1}, {2, 1, 1}),
                                  {0, 1 - kPadOfTwo, 1 - kPadOfTwo},
                                  {2, 1 + kPadOfTwo, 1 + kPadOfTwo}},
                      InflateCase{"flat_in_z", AABB({0, 0, 7}, {3, 4, 7}), {0, 0, 7 - 0.5}, {3, 4, 7 + 0.5}},
                      InflateCase{"solid_box_untouched", AABB({0, 0, 0}, {1, 2, 3}), {0, 0, 0}, {1, 2, 3}},
                      InflateCase{"point_stays_a_point", AABB({4, 5, 6}, {4, 5, 6}), {4, 5, 6}, {4, 5, 6}},
                      InflateCase{"empty_box_unchanged", AABB(), glm::dvec3(kMax), glm::dvec3(-kMax)}),
    [](const ::testing::TestParamInfo<InflateCase>& info) { return std::string(info.param.name); });

TEST(CollisionInflateRounding, PadIsRoundedToSinglePrecision) {
  AABB box({0, 0, 0}, {1.0 / 3.0, 0, 0});
  box.inflateFlatAxes();
  const double exact = (1.0 / 3.0) * 0.1;
  const double pad = box.upper.y;
  EXPECT_EQ(static_cast<double>(static_cast<float>(pad)), pad) << "pad is not a float value";
  EXPECT_NEAR(pad, exact, 1e-8);
  EXPECT_NE(pad, exact);
  EXPECT_EQ(box.lower.z, -pad);
}

}  // namespace
