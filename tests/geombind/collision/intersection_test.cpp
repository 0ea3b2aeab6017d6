#include "geombind/collision/intersection.h"

#include <algorithm>
#include <cmath>
#include <iomanip>
#include <limits>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include <glm/geometric.hpp>
#include <glm/vec3.hpp>
#include <gtest/gtest.h>

namespace {

namespace col = TessikSDK::GeomBind::Collision;
using col::AABB;
using col::Segment;
using col::Triangle;
using glm::dvec3;

constexpr double kInf = std::numeric_limits<double>::infinity();

std::string str(const dvec3& v) {
  std::ostringstream out;
  out << std::setprecision(17) << "(" << v.x << ", " << v.y << ", " << v.z << ")";
  return out.str();
}

// All corners below are exactly representable with exactly representable centres and half sizes, so
// touching geometry stays touching after the tests' own arithmetic.
const AABB kBox(dvec3(-1.0, -2.0, -0.5), dvec3(1.0, 2.0, 0.5));

// A point of kBox picked per axis: 0 = lower, 1 = centre, 2 = upper.
dvec3 boxPoint(const int pick[3]) {
  dvec3 p;
  for (int k = 0; k < 3; ++k) p[k] = pick[k] == 0 ? kBox.lower[k] : pick[k] == 2 ? kBox.upper[k] : 0.0;
  return p;
}

TEST(ContainsClosedBox, BoundaryInsideAndOneStepOutwardOutside) {
  for (int code = 0; code < 27; ++code) {
    const int pick[3] = {code % 3, code / 3 % 3, code / 9};
    const dvec3 p = boxPoint(pick);
    SCOPED_TRACE(str(p));
    EXPECT_TRUE(col::contains(kBox, p));
    for (int k = 0; k < 3; ++k) {
      if (pick[k] == 1) continue;
      dvec3 out = p;
      out[k] = std::nextafter(p[k], pick[k] == 2 ? kInf : -kInf);
      EXPECT_FALSE(col::contains(kBox, out)) << "axis " << k;
    }
  }
}

TEST(BoxBoxOverlap, SharedFaceEdgeOrCornerOverlapsAndOneStepApartDoesNot) {
  const dvec3 size = kBox.upper - kBox.lower;
  for (int code = 0; code < 27; ++code) {
    const dvec3 dir(code % 3 - 1, code / 3 % 3 - 1, code / 9 - 1);
    const AABB touching(kBox.lower + dir * size, kBox.upper + dir * size);
    SCOPED_TRACE(str(dir));
    EXPECT_TRUE(col::intersects(kBox, touching));
    EXPECT_TRUE(col::intersects(touching, kBox));
    for (int k = 0; k < 3; ++k) {
      if (dir[k] == 0.0) continue;
      AABB apart = touching;
      const double toward = dir[k] > 0 ? kInf : -kInf;
      apart.lower[k] = std::nextafter(apart.lower[k], toward);
      apart.upper[k] = std::nextafter(apart.upper[k], toward);
      EXPECT_FALSE(col::intersects(kBox, apart)) << "axis " << k;
      EXPECT_FALSE(col::intersects(apart, kBox)) << "axis " << k;
    }
  }
}

TEST(SegmentBoxTouching, AxisParallelSegmentInFacePlaneIntersects) {
  constexpr double kGap = 1e-9;
  for (int k = 0; k < 3; ++k) {
    for (const double face : {kBox.lower[k], kBox.upper[k]}) {
      for (int along = 0; along < 3; ++along) {
        if (along == k) continue;
        const int other = 3 - k - along;
        dvec3 a, b;
        a[k] = b[k] = face;
        a[other] = b[other] = 0.5 * kBox.upper[other];
        a[along] = kBox.lower[along] - 3.0;
        b[along] = kBox.upper[along] + 0.25;
        SCOPED_TRACE(str(a) + " -> " + str(b));
        EXPECT_TRUE(col::intersects(kBox, Segment(a, b)));
        EXPECT_TRUE(col::intersects(kBox, Segment(b, a)));
        // Lifted off the face, or moved beyond the face's edge within the plane.
        const dvec3 lift = (face > 0 ? kGap : -kGap) * dvec3(k == 0, k == 1, k == 2);
        EXPECT_FALSE(col::intersects(kBox, Segment(a + lift, b + lift)));
        a[other] = b[other] = kBox.upper[other] + kGap;
        EXPECT_FALSE(col::intersects(kBox, Segment(a, b)));
      }
    }
  }
}

TEST(SegmentBoxTouching, EndPointOnCornerIntersects) {
  for (int code = 0; code < 8; ++code) {
    const int pick[3] = {2 * (code & 1), code & 2, (code & 4) / 2};
    const dvec3 corner = boxPoint(pick);
    const dvec3 outward = glm::sign(corner) * dvec3(0.5, 1.25, 3.0);
    SCOPED_TRACE(str(corner));
    EXPECT_TRUE(col::intersects(kBox, Segment(corner, corner + outward)));
    EXPECT_TRUE(col::intersects(kBox, Segment(corner + outward, corner)));
    EXPECT_FALSE(col::intersects(kBox, Segment(corner + 1e-9 * outward, corner + outward)));
  }
}

// Per face: a triangle in the face plane covering part of the face, and one cutting past the face's
// corner so that only an edge axis separates it.
TEST(TriangleBoxTouching, TriangleInFacePlaneOverlapsOnlyWhereItCoversTheFace) {
  const dvec3 centre(0.0), half = kBox.upper;
  for (int k = 0; k < 3; ++k) {
    const int i = (k + 1) % 3, j = (k + 2) % 3;
    for (const double face : {kBox.lower[k], kBox.upper[k]}) {
      auto at = [&](double u, double v) {
        dvec3 p;
        p[k] = face;
        p[i] = u * half[i];
        p[j] = v * half[j];
        return p;
      };
      const Triangle covering(at(0.0, 0.0), at(2.0, 0.0), at(0.0, 3.0));
      const Triangle pastCorner(at(2.25, 0.0), at(0.0, 2.25), at(3.0, 3.0));
      for (const bool flip : {false, true}) {
        const auto wind = [flip](const Triangle& t) { return flip ? Triangle(t.a, t.c, t.b) : t; };
        SCOPED_TRACE(::testing::Message() << "axis " << k << " face " << face << " flip " << flip);
        EXPECT_TRUE(col::intersects(kBox, wind(covering)));
        EXPECT_TRUE(col::triangleBoxOverlap(centre, half, wind(covering)));
        EXPECT_FALSE(col::intersects(kBox, wind(pastCorner)));
        EXPECT_FALSE(col::triangleBoxOverlap(centre, half, wind(pastCorner)));
      }
    }
  }
}

// A sliver: c lies on the line through a and b up to rounding, and edge ab runs through the middle of
// the box. The normal e0 x e1 is pure rounding noise here; testing its plane would reject the pair for
// some vertex orders.
TEST(TriangleBoxSliver, EdgeThroughBoxOverlapsForEveryVertexOrder) {
  const AABB box(dvec3(-0.5), dvec3(0.5));
  const dvec3 a(-0.3, -0.9, -0.6), b(0.9, 0.6, 0.3), c(-0.42, -1.05, -0.69);
  ASSERT_TRUE(col::contains(box, 0.5 * (a + b)));
  for (const Triangle& t : {Triangle(a, b, c), Triangle(b, c, a), Triangle(c, a, b)})
    EXPECT_TRUE(col::intersects(box, t)) << str(t.a) << str(t.b) << str(t.c);
}

struct LineCase {
  const char* name;
  Segment segment;
  bool crosses;
};

void PrintTo(const LineCase& lineCase, std::ostream* out) { *out << lineCase.name; }

class LineTriangleCrossing : public ::testing::TestWithParam<LineCase> {};

// The answer must not depend on the segment's direction, the winding or the first vertex.
TEST_P(LineTriangleCrossing, AnswerIsTheSameForEveryOrdering) {
  const dvec3 a(0, 0, 0), b(4, 0, 0), c(0, 4, 0);
  const Triangle orders[] = {{a, b, c}, {b, c, a}, {c, a, b}, {a, c, b}, {c, b, a}, {b, a, c}};
  const Segment& s = GetParam().segment;
  for (const Triangle& t : orders) {
    SCOPED_TRACE(str(t.a) + " " + str(t.b) + " " + str(t.c));
    EXPECT_EQ(col::intersects(s, t), GetParam().crosses);
    EXPECT_EQ(col::intersects(Segment(s.b, s.a), t), GetParam().crosses);
  }
}

INSTANTIATE_TEST_SUITE_P(
    Cases,
    LineTriangleCrossing,
    ::testing::Values(LineCase{"Interior", Segment(dvec3(1, 1, -1), dvec3(1, 1, 1)), true},
                      LineCase{"Oblique", Segment(dvec3(0, 0, -2), dvec3(2, 1, 2)), true},
                      LineCase{"TriangleBeyondB", Segment(dvec3(1, 1, -3), dvec3(1, 1, -2)), true},
                      LineCase{"TriangleBeforeA", Segment(dvec3(1, 2, 5), dvec3(1, 2, 9)), true},
                      LineCase{"Outside", Segment(dvec3(3, 3, -1), dvec3(3, 3, 1)), false},
                      LineCase{"ThroughEdge", Segment(dvec3(2, 0, -1), dvec3(2, 0, 1)), false},
                      LineCase{"ObliqueThroughLongEdge", Segment(dvec3(0, 1, -1), dvec3(4, 3, 1)), false},
                      LineCase{"ThroughVertex", Segment(dvec3(1, 7, 1), dvec3(2, 10, 2)), false},
                      LineCase{"ParallelAbovePlane", Segment(dvec3(1, 1, 1), dvec3(2, 3, 1)), false},
                      LineCase{"InPlaneMissing", Segment(dvec3(5, 5, 0), dvec3(6, 7, 0)), true},
                      LineCase{"InPlaneCrossing", Segment(dvec3(-1, 1, 0), dvec3(5, 1, 0)), true}),
    [](const ::testing::TestParamInfo<LineCase>& info) { return std::string(info.param.name); });

// a = (1, 2, 3), b = a + 5u with u = (0.6, -0.8, 0); q is perpendicular to u with |q| = 2.5.
class SegmentDistance : public ::testing::Test {
 protected:
  const dvec3 a{1, 2, 3}, u{0.6, -0.8, 0}, q{1.2, 0.9, 2.0};
  const Segment segment{a, a + 5.0 * u};
};

TEST_F(SegmentDistance, ContinuousAcrossStartAndEndPointRulesBeyond) {
  EXPECT_NEAR(col::distance(a + q - 1e-9 * u, segment), 2.5, 1e-12);
  EXPECT_NEAR(col::distance(a + q + 1e-9 * u, segment), 2.5, 1e-12);
  EXPECT_NEAR(col::distance(a + q - 1.0 * u, segment), std::sqrt(1.0 + 6.25), 1e-12);
  EXPECT_NEAR(col::distance(a + q + 2.0 * u, segment), 2.5, 1e-12);
  EXPECT_NEAR(col::distance(a + q + 7.0 * u, segment), std::sqrt(4.0 + 6.25), 1e-12);
}

TEST_F(SegmentDistance, CoincidentEndPointsActAsThatPoint) {
  const Segment point(a, a);
  EXPECT_NEAR(col::distance(a + q + 2.0 * u, point), std::sqrt(4.0 + 6.25), 1e-12);
  EXPECT_EQ(col::distance(a, point), 0.0);
  const dvec3 nearest = col::closestPoint(a + q, point);
  EXPECT_EQ(nearest, a);
}

TEST(SegmentDistanceOnSegment, PointsOnLongSkewedSegmentsAreAtZeroNotNaN) {
  std::mt19937 rng(11);
  std::uniform_real_distribution<double> unit(-1.0, 1.0), t(0.0, 1.0);
  for (int i = 0; i < 200; ++i) {
    const double scale = std::pow(10.0, 1 + i % 5);
    const dvec3 a = 3.0 * scale * dvec3(unit(rng), unit(rng), unit(rng));
    const dvec3 b = a + scale * dvec3(unit(rng), 1e-3 * unit(rng), 0.3 * unit(rng));
    const Segment segment(a, b);
    const double tol = 1e-7 * (glm::length(a) + glm::length(b));
    for (int j = 0; j < 50; ++j) {
      const dvec3 p = a + t(rng) * (b - a);
      const double d = col::distance(p, segment);
      ASSERT_FALSE(std::isnan(d)) << str(a) << " -> " << str(b) << " at " << str(p);
      EXPECT_LE(d, tol);
      EXPECT_LE(glm::length(col::closestPoint(p, segment) - p), tol);
    }
  }
}

TEST(SegmentDistanceSampled, DistanceAndClosestPointMatchDenseSampling) {
  std::mt19937 rng(5);
  std::uniform_real_distribution<double> unit(-2.0, 2.0);
  for (int i = 0; i < 400; ++i) {
    const dvec3 a(unit(rng), unit(rng), unit(rng));
    const dvec3 b = i % 10 == 0 ? a : dvec3(unit(rng), unit(rng), unit(rng));
    const dvec3 p(unit(rng), unit(rng), unit(rng));
    const Segment segment(a, b);
    constexpr int kSteps = 4000;
    double sampled = kInf;
    for (int s = 0; s <= kSteps; ++s)
      sampled = std::min(sampled, glm::length(p - glm::mix(a, b, s / double(kSteps))));
    const double halfStep = 0.5 * glm::length(b - a) / kSteps;
    SCOPED_TRACE(str(a) + " -> " + str(b) + " from " + str(p));
    const double d = col::distance(p, segment);
    EXPECT_LE(d, sampled + 1e-12);
    EXPECT_GE(d, sampled - halfStep - 1e-12);
    const dvec3 nearest = col::closestPoint(p, segment);
    EXPECT_NEAR(glm::length(p - nearest), d, 1e-9);
    // On the segment: it splits the segment's length.
    EXPECT_NEAR(glm::length(nearest - a) + glm::length(b - nearest), glm::length(b - a), 1e-9);
  }
}

// Randomized agreement with a reference built from dense samples of the segment or triangle. A pair
// counts as overlapping when a sample lies in the box shrunk by kMargin (for a flat box: when the
// primitive passes clearly through the box's plane at a point that deep inside the face), as separated
// when every sample is farther than kMargin plus the sampling bound from the box, and is skipped
// otherwise.
constexpr double kMargin = 0.02;
enum class Verdict { kOverlap, kSeparated, kBorderline };

double pointBoxDistance(const AABB& box, const dvec3& p) {
  const dvec3 gap = glm::max(glm::max(box.lower - p, p - box.upper), dvec3(0.0));
  return glm::length(gap);
}

int flatAxis(const AABB& box) {
  for (int k = 0; k < 3; ++k)
    if (box.lower[k] == box.upper[k]) return k;
  return -1;
}

bool deepInside(const AABB& box, const dvec3& p, int skipAxis) {
  for (int k = 0; k < 3; ++k)
    if (k != skipAxis && (p[k] < box.lower[k] + kMargin || p[k] > box.upper[k] - kMargin)) return false;
  return true;
}

// Points of the polygon's section by the plane of the flat axis, if the polygon clearly crosses it.
std::vector<dvec3> planeSection(const std::vector<dvec3>& corners, int axis, double level) {
  std::vector<dvec3> ends;
  double lo = kInf, hi = -kInf;
  for (size_t i = 0; i < corners.size(); ++i) {
    const dvec3 &p = corners[i], &q = corners[(i + 1) % corners.size()];
    const double vp = p[axis] - level, vq = q[axis] - level;
    lo = std::min(lo, vp);
    hi = std::max(hi, vp);
    if (vp == 0.0) ends.push_back(p);
    if (vp * vq < 0.0) ends.push_back(p + (vp / (vp - vq)) * (q - p));
  }
  std::vector<dvec3> section;
  if (lo >= -kMargin || hi <= kMargin) return section;
  for (int s = 0; s <= 400; ++s) section.push_back(glm::mix(ends.front(), ends.back(), s / 400.0));
  return section;
}

// `spacing` bounds the distance from any point of the primitive to its nearest sample.
Verdict classify(const AABB& box,
                 const std::vector<dvec3>& corners,
                 const std::vector<dvec3>& samples,
                 double spacing) {
  const int flat = flatAxis(box);
  const std::vector<dvec3> witnesses = flat < 0 ? samples : planeSection(corners, flat, box.lower[flat]);
  for (const dvec3& p : witnesses)
    if (deepInside(box, p, flat)) return Verdict::kOverlap;
  double nearest = kInf;
  for (const dvec3& p : samples) nearest = std::min(nearest, pointBoxDistance(box, p));
  return nearest > spacing + kMargin ? Verdict::kSeparated : Verdict::kBorderline;
}

enum class Shape { kGeneral, kAxisParallel, kCollinear, kPoint };

struct Scenario {
  const char* name;
  Shape shape;
  double spread;  // vertices lie within this distance of the box centre on each axis
  bool onGrid;    // corners and vertices on a 1/64 grid, so that collinear vertices stay exactly collinear
  int minFlatOverlaps;
};

void PrintTo(const Scenario& scenario, std::ostream* out) { *out << scenario.name; }

dvec3 snap(const dvec3& p, bool onGrid) { return onGrid ? glm::round(p * 64.0) / 64.0 : p; }

AABB randomBox(std::mt19937& rng, const Scenario& scenario) {
  std::uniform_real_distribution<double> centre(-1.0, 1.0), half(0.1, 1.0), unit(0.0, 1.0);
  const dvec3 c(centre(rng), centre(rng), centre(rng));
  dvec3 h(half(rng), half(rng), half(rng));
  if (unit(rng) < 0.3) h[rng() % 3] = 0.0;
  return AABB(snap(c - h, scenario.onGrid), snap(c + h, scenario.onGrid));
}

dvec3 randomNear(std::mt19937& rng, const AABB& box, const Scenario& scenario) {
  std::uniform_real_distribution<double> offset(-scenario.spread, scenario.spread);
  const dvec3 p = 0.5 * (box.lower + box.upper) + dvec3(offset(rng), offset(rng), offset(rng));
  return snap(p, scenario.onGrid);
}

struct Tally {
  int overlaps = 0, separations = 0, flatOverlaps = 0;
  void add(Verdict v, const AABB& box) {
    overlaps += v == Verdict::kOverlap;
    separations += v == Verdict::kSeparated;
    flatOverlaps += v == Verdict::kOverlap && flatAxis(box) >= 0;
  }
  void expectEnough(const Scenario& scenario) const {
    EXPECT_GE(overlaps, 200);
    EXPECT_GE(separations, 200);
    EXPECT_GE(flatOverlaps, scenario.minFlatOverlaps);
  }
};

class TriangleBoxMatchesSampling : public ::testing::TestWithParam<Scenario> {};

TEST_P(TriangleBoxMatchesSampling, AgreesOnEveryClearCase) {
  const Scenario& scenario = GetParam();
  std::mt19937 rng(21);
  std::uniform_real_distribution<double> along(-0.5, 1.5);
  Tally tally;
  for (int pair = 0; pair < 1500; ++pair) {
    const AABB box = randomBox(rng, scenario);
    const dvec3 a = randomNear(rng, box, scenario);
    dvec3 b = scenario.shape == Shape::kPoint ? a : randomNear(rng, box, scenario);
    dvec3 c = scenario.shape == Shape::kGeneral ? randomNear(rng, box, scenario) : a;
    if (scenario.shape == Shape::kCollinear) c = a + std::round(along(rng) * 4.0) / 4.0 * (b - a);
    const double longest = std::max({glm::length(b - a), glm::length(c - b), glm::length(a - c)});
    const int steps = std::max(1, static_cast<int>(std::ceil(longest / 0.02)));
    std::vector<dvec3> samples;
    for (int i = 0; i <= steps; ++i)
      for (int j = 0; i + j <= steps; ++j)
        samples.push_back(a + (double(i) * (b - a) + double(j) * (c - a)) / double(steps));
    const Verdict verdict = classify(box, {a, b, c}, samples, longest / steps);
    tally.add(verdict, box);
    if (verdict == Verdict::kBorderline) continue;
    const bool expected = verdict == Verdict::kOverlap;
    SCOPED_TRACE("box " + str(box.lower) + " " + str(box.upper) + " triangle " + str(a) + str(b) + str(c));
    EXPECT_EQ(col::intersects(box, Triangle(a, b, c)), expected);
    EXPECT_EQ(col::intersects(box, Triangle(b, a, c)), expected);
    const dvec3 centre = 0.5 * (box.lower + box.upper), half = 0.5 * (box.upper - box.lower);
    EXPECT_EQ(col::triangleBoxOverlap(centre, half, Triangle(c, a, b)), expected);
  }
  tally.expectEnough(scenario);
}

INSTANTIATE_TEST_SUITE_P(Shapes,
                         TriangleBoxMatchesSampling,
                         ::testing::Values(Scenario{"General", Shape::kGeneral, 2.0, false, 50},
                                           Scenario{"Collinear", Shape::kCollinear, 2.0, true, 20},
                                           Scenario{"Point", Shape::kPoint, 0.8, false, 0}),
                         [](const auto& info) { return std::string(info.param.name); });

class SegmentBoxMatchesSampling : public ::testing::TestWithParam<Scenario> {};

TEST_P(SegmentBoxMatchesSampling, AgreesOnEveryClearCase) {
  const Scenario& scenario = GetParam();
  std::mt19937 rng(33);
  Tally tally;
  for (int pair = 0; pair < 3000; ++pair) {
    const AABB box = randomBox(rng, scenario);
    const dvec3 a = randomNear(rng, box, scenario);
    dvec3 b = scenario.shape == Shape::kPoint ? a : randomNear(rng, box, scenario);
    if (scenario.shape == Shape::kAxisParallel) {
      const int axis = static_cast<int>(rng() % 3);
      for (int k = 0; k < 3; ++k)
        if (k != axis) b[k] = a[k];
    }
    const int steps = std::max(1, static_cast<int>(std::ceil(glm::length(b - a) / 0.01)));
    std::vector<dvec3> samples;
    for (int s = 0; s <= steps; ++s) samples.push_back(glm::mix(a, b, s / double(steps)));
    const Verdict verdict = classify(box, {a, b}, samples, 0.5 * glm::length(b - a) / steps);
    tally.add(verdict, box);
    if (verdict == Verdict::kBorderline) continue;
    SCOPED_TRACE("box " + str(box.lower) + " " + str(box.upper) + " segment " + str(a) + str(b));
    EXPECT_EQ(col::intersects(box, Segment(a, b)), verdict == Verdict::kOverlap);
    EXPECT_EQ(col::intersects(box, Segment(b, a)), verdict == Verdict::kOverlap);
  }
  tally.expectEnough(scenario);
}

INSTANTIATE_TEST_SUITE_P(Shapes,
                         SegmentBoxMatchesSampling,
                         ::testing::Values(Scenario{"General", Shape::kGeneral, 2.0, false, 20},
                                           Scenario{"AxisParallel", Shape::kAxisParallel, 1.2, false, 20},
                                           Scenario{"Point", Shape::kPoint, 0.8, false, 0}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
