#include "geombind/collision/intersection.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <random>
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
  using ::testing::PrintToString;  // prints doubles with enough digits to tell neighbours apart
  return "(" + PrintToString(v.x) + ", " + PrintToString(v.y) + ", " + PrintToString(v.z) + ")";
}

// Symmetric about the origin with exactly representable corners, so touching geometry stays touching
// after the tests' own arithmetic.
const AABB kBox(dvec3(-1.0, -2.0, -0.5), dvec3(1.0, 2.0, 0.5));

// Unit vector along axis k.
dvec3 axis(int k) {
  dvec3 e(0.0);
  e[k] = 1.0;
  return e;
}

// The 27 directions with components in {-1, 0, 1}.
dvec3 direction(int code) { return dvec3(code % 3 - 1, code / 3 % 3 - 1, code / 9 - 1); }

// Boundary points of kBox, boxes sharing a face, edge or corner with it and segments ending on a corner
// count; one step outward along any axis the point or box leaves does not.
TEST(ClosedBox, BoundaryPointsAndTouchingBoxesCountOneStepOutsideDoesNot) {
  const dvec3 size = kBox.upper - kBox.lower;
  for (int code = 0; code < 27; ++code) {
    const dvec3 dir = direction(code), p = dir * kBox.upper, outward = dir * dvec3(0.5, 1.25, 3.0);
    const AABB touching(kBox.lower + dir * size, kBox.upper + dir * size);
    SCOPED_TRACE(str(dir));
    EXPECT_TRUE(col::contains(kBox, p));
    EXPECT_TRUE(col::intersects(kBox, touching));
    EXPECT_TRUE(col::intersects(touching, kBox));
    if (dir.x * dir.y * dir.z != 0.0) {
      EXPECT_TRUE(col::intersects(kBox, Segment(p, p + outward)));
      EXPECT_TRUE(col::intersects(kBox, Segment(p + outward, p)));
      EXPECT_FALSE(col::intersects(kBox, Segment(p + 1e-9 * outward, p + outward)));
    }
    for (int k = 0; k < 3; ++k) {
      if (dir[k] == 0.0) continue;
      dvec3 out = p;
      AABB apart = touching;
      out[k] = std::nextafter(p[k], dir[k] * kInf);
      apart.lower[k] = std::nextafter(apart.lower[k], dir[k] * kInf);
      apart.upper[k] = std::nextafter(apart.upper[k], dir[k] * kInf);
      EXPECT_FALSE(col::contains(kBox, out)) << "axis " << k;
      EXPECT_FALSE(col::intersects(kBox, apart)) << "axis " << k;
      EXPECT_FALSE(col::intersects(apart, kBox)) << "axis " << k;
    }
  }
}

// Per face: an axis-parallel segment in the face plane touches; lifted off the face, or moved past the
// face's edge within its plane, it does not.
TEST(SegmentBoxTouching, AxisParallelSegmentInFacePlaneIntersects) {
  for (int k = 0; k < 3; ++k) {
    for (int along = 0; along < 3; ++along) {
      if (along == k) continue;
      const int other = 3 - k - along;
      for (const double face : {kBox.lower[k], kBox.upper[k]}) {
        const dvec3 onFace = face * axis(k) + 0.5 * kBox.upper[other] * axis(other);
        const dvec3 a = onFace + (kBox.lower[along] - 3.0) * axis(along);
        const dvec3 b = onFace + (kBox.upper[along] + 0.25) * axis(along);
        const dvec3 lift = (face > 0 ? 1e-9 : -1e-9) * axis(k),
                    beyond = (0.5 * kBox.upper[other] + 1e-9) * axis(other);
        SCOPED_TRACE(str(a) + " -> " + str(b));
        EXPECT_TRUE(col::intersects(kBox, Segment(a, b)));
        EXPECT_TRUE(col::intersects(kBox, Segment(b, a)));
        EXPECT_FALSE(col::intersects(kBox, Segment(a + lift, b + lift)));
        EXPECT_FALSE(col::intersects(kBox, Segment(a + beyond, b + beyond)));
      }
    }
  }
}

// Per face, in either winding: a triangle in the face plane covering part of the face overlaps; one
// cutting past the face's corner, so that only an edge axis separates it, does not.
TEST(TriangleBoxTouching, TriangleInFacePlaneOverlapsOnlyWhereItCoversTheFace) {
  for (int k = 0; k < 3; ++k) {
    for (const double face : {kBox.lower[k], kBox.upper[k]}) {
      const auto at = [&](double u, double v) {
        return face * axis(k) + (u * axis((k + 1) % 3) + v * axis((k + 2) % 3)) * kBox.upper;
      };
      for (const bool covers : {true, false}) {
        const Triangle t =
            covers ? Triangle(at(0, 0), at(2, 0), at(0, 3)) : Triangle(at(2.25, 0), at(0, 2.25), at(3, 3));
        for (const Triangle& wound : {t, Triangle(t.a, t.c, t.b)}) {
          SCOPED_TRACE(str(wound.a) + str(wound.b) + str(wound.c));
          EXPECT_EQ(col::intersects(kBox, wound), covers);
          EXPECT_EQ(col::triangleBoxOverlap(dvec3(0.0), kBox.upper, wound), covers);
        }
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

// The infinite line through the segment against the triangle (0,0,0) (4,0,0) (0,4,0): the answer must
// not depend on the segment's direction, the winding or the first vertex.
TEST(LineTriangleCrossing, AnswerIsTheSameForEveryOrdering) {
  const struct {
    const char* name;
    dvec3 from, to;
    bool crosses;
  } cases[] = {{"interior", {1, 1, -1}, {1, 1, 1}, true},
               {"oblique", {0, 0, -2}, {2, 1, 2}, true},
               {"triangle beyond the end", {1, 1, -3}, {1, 1, -2}, true},
               {"triangle before the start", {1, 2, 5}, {1, 2, 9}, true},
               {"outside", {3, 3, -1}, {3, 3, 1}, false},
               {"through an edge", {2, 0, -1}, {2, 0, 1}, false},
               {"oblique through the long edge", {0, 1, -1}, {4, 3, 1}, false},
               {"through a vertex", {1, 7, 1}, {2, 10, 2}, false},
               {"parallel above the plane", {1, 1, 1}, {2, 3, 1}, false},
               {"in the plane, missing", {5, 5, 0}, {6, 7, 0}, true},
               {"in the plane, crossing", {-1, 1, 0}, {5, 1, 0}, true}};
  const dvec3 a(0, 0, 0), b(4, 0, 0), c(0, 4, 0);
  for (const auto& line : cases) {
    for (const Triangle& t : {Triangle{a, b, c}, Triangle{b, c, a}, Triangle{c, a, b}, Triangle{a, c, b},
                              Triangle{c, b, a}, Triangle{b, a, c}}) {
      SCOPED_TRACE(line.name + (" " + str(t.a) + " " + str(t.b) + " " + str(t.c)));
      EXPECT_EQ(col::intersects(Segment(line.from, line.to), t), line.crosses);
      EXPECT_EQ(col::intersects(Segment(line.to, line.from), t), line.crosses);
    }
  }
}

// Every tenth segment has coincident end points, which must act as that point.
TEST(SegmentDistance, DistanceAndClosestPointMatchDenseSampling) {
  std::mt19937 rng(5);
  std::uniform_real_distribution<double> unit(-2.0, 2.0);
  for (int i = 0; i < 400; ++i) {
    const dvec3 a(unit(rng), unit(rng), unit(rng));
    const dvec3 b = i % 10 == 0 ? a : dvec3(unit(rng), unit(rng), unit(rng));
    const dvec3 p(unit(rng), unit(rng), unit(rng));
    constexpr int kSteps = 4000;
    double sampled = kInf;
    for (int s = 0; s <= kSteps; ++s)
      sampled = std::min(sampled, glm::length(p - glm::mix(a, b, s / 4000.0)));
    SCOPED_TRACE(str(a) + " -> " + str(b) + " from " + str(p));
    const double d = col::distance(p, Segment(a, b));
    EXPECT_LE(d, sampled + 1e-12);
    EXPECT_GE(d, sampled - 0.5 * glm::length(b - a) / kSteps - 1e-12);
    const dvec3 nearest = col::closestPoint(p, Segment(a, b));
    EXPECT_NEAR(glm::length(p - nearest), d, 1e-9);
    // On the segment: it splits the segment's length.
    EXPECT_NEAR(glm::length(nearest - a) + glm::length(b - nearest), glm::length(b - a), 1e-9);
    EXPECT_TRUE(a != b || nearest == a) << "coincident end points must answer that point";
  }
}

TEST(SegmentDistance, PointsOnLongSkewedSegmentsAreAtZeroNotNaN) {
  std::mt19937 rng(11);
  std::uniform_real_distribution<double> unit(-1.0, 1.0);
  for (int i = 0; i < 10000; ++i) {
    const double scale = std::pow(10.0, 1 + i % 5);
    const dvec3 a = 3.0 * scale * dvec3(unit(rng), unit(rng), unit(rng));
    const dvec3 b = a + scale * dvec3(unit(rng), 1e-3 * unit(rng), 0.3 * unit(rng));
    const dvec3 p = a + (0.5 + 0.5 * unit(rng)) * (b - a);
    const double d = col::distance(p, Segment(a, b)), tol = 1e-7 * (glm::length(a) + glm::length(b));
    ASSERT_FALSE(std::isnan(d)) << str(a) << " -> " << str(b) << " at " << str(p);
    EXPECT_LE(d, tol);
    EXPECT_LE(glm::length(col::closestPoint(p, Segment(a, b)) - p), tol);
  }
}

// Randomized agreement with a reference built from dense samples of the segment or triangle. A pair
// counts as overlapping when a sample lies in the box shrunk by kMargin (for a flat box: when the
// primitive passes clearly through the box's plane at a point that deep inside the face), as separated
// when every sample is farther than kMargin plus the sampling bound from the box, and is skipped
// otherwise.
constexpr double kMargin = 0.02;

enum class Shape { kGeneral, kAxisParallel, kCollinear, kPoint };

struct Scenario {
  const char* name;
  bool triangle;  // else the segment a -> b (c = a)
  Shape shape;
  double spread;  // vertices lie within this distance of the box centre on each axis
  int minFlatOverlaps;
};

class BoxOverlapMatchesSampling : public ::testing::TestWithParam<Scenario> {};

TEST_P(BoxOverlapMatchesSampling, AgreesOnEveryClearCase) {
  const Scenario& sc = GetParam();
  std::mt19937 rng(sc.triangle ? 21 : 33);
  std::uniform_real_distribution<double> place(-1.0, 1.0), half(0.1, 1.0), unit(0.0, 1.0), along(-0.5, 1.5),
      offset(-sc.spread, sc.spread);
  // Collinear vertices stay exactly collinear on a 1/64 grid; the box corners go on it too.
  const bool onGrid = sc.shape == Shape::kCollinear;
  const auto snap = [&](const dvec3& p) { return onGrid ? glm::round(p * 64.0) / 64.0 : p; };
  int overlaps = 0, separations = 0, flatOverlaps = 0;
  for (int pair = 0; pair < (sc.triangle ? 1500 : 3000); ++pair) {
    const dvec3 mid(place(rng), place(rng), place(rng));
    dvec3 h(half(rng), half(rng), half(rng));
    int flat = -1;
    if (unit(rng) < 0.3) h[flat = static_cast<int>(rng() % 3)] = 0.0;
    const AABB box(snap(mid - h), snap(mid + h));
    const auto near = [&] { return snap(mid + dvec3(offset(rng), offset(rng), offset(rng))); };
    const dvec3 a = near();
    dvec3 b = sc.shape == Shape::kPoint ? a : near();
    dvec3 c = sc.triangle && sc.shape == Shape::kGeneral ? near() : a;
    if (sc.shape == Shape::kCollinear) c = a + std::round(along(rng) * 4.0) / 4.0 * (b - a);
    if (sc.shape == Shape::kAxisParallel) b = a + axis(static_cast<int>(rng() % 3)) * (b - a);
    // Samples no farther apart than `spacing` from any point of the primitive.
    const double longest = std::max({glm::length(b - a), glm::length(c - b), glm::length(a - c)});
    const int steps = std::max(1, static_cast<int>(std::ceil(longest / (sc.triangle ? 0.02 : 0.01))));
    const double spacing = (sc.triangle ? 1.0 : 0.5) * longest / steps;
    std::vector<dvec3> samples;
    for (int i = 0; i <= steps; ++i)
      for (int j = 0; i + j <= (sc.triangle ? steps : i); ++j)
        samples.push_back(a + (double(i) * (b - a) + double(j) * (c - a)) / double(steps));
    // Overlap witnesses: the samples, or for a flat box the primitive's section by the box's plane.
    std::vector<dvec3> witnesses = samples, ends;
    if (flat >= 0) {
      witnesses.clear();
      const dvec3 corners[] = {a, b, c};
      for (int i = 0; i < 3; ++i) {
        const dvec3 &p = corners[i], &q = corners[(i + 1) % 3];
        const double vp = p[flat] - box.lower[flat], vq = q[flat] - box.lower[flat];
        if (vp * vq < 0.0) ends.push_back(p + (vp / (vp - vq)) * (q - p));
      }
      const double lo = std::min({a[flat], b[flat], c[flat]}), hi = std::max({a[flat], b[flat], c[flat]});
      if (lo < box.lower[flat] - kMargin && hi > box.lower[flat] + kMargin)
        for (int s = 0; s <= 400; ++s) witnesses.push_back(glm::mix(ends.front(), ends.back(), s / 400.0));
    }
    const bool overlap = std::any_of(witnesses.begin(), witnesses.end(), [&](const dvec3& p) {
      for (int k = 0; k < 3; ++k)
        if (k != flat && (p[k] < box.lower[k] + kMargin || p[k] > box.upper[k] - kMargin)) return false;
      return true;
    });
    double nearest = kInf;
    for (const dvec3& p : samples)
      nearest = std::min(nearest, glm::length(glm::max(glm::max(box.lower - p, p - box.upper), dvec3(0.0))));
    const bool separated = !overlap && nearest > spacing + kMargin;
    overlaps += overlap;
    separations += separated;
    flatOverlaps += overlap && flat >= 0;
    if (!overlap && !separated) continue;
    SCOPED_TRACE("box " + str(box.lower) + " " + str(box.upper) + " vertices " + str(a) + str(b) + str(c));
    if (sc.triangle) {
      EXPECT_EQ(col::intersects(box, Triangle(a, b, c)), overlap);
      EXPECT_EQ(col::intersects(box, Triangle(b, a, c)), overlap);
      const dvec3 centre = 0.5 * (box.lower + box.upper), halfSize = 0.5 * (box.upper - box.lower);
      EXPECT_EQ(col::triangleBoxOverlap(centre, halfSize, Triangle(c, a, b)), overlap);
    } else {
      EXPECT_EQ(col::intersects(box, Segment(a, b)), overlap);
      EXPECT_EQ(col::intersects(box, Segment(b, a)), overlap);
    }
  }
  EXPECT_GE(overlaps, 200);
  EXPECT_GE(separations, 200);
  EXPECT_GE(flatOverlaps, sc.minFlatOverlaps);
}

INSTANTIATE_TEST_SUITE_P(Shapes,
                         BoxOverlapMatchesSampling,
                         ::testing::Values(Scenario{"Triangle", true, Shape::kGeneral, 2.0, 50},
                                           Scenario{"CollinearTriangle", true, Shape::kCollinear, 2.0, 20},
                                           Scenario{"PointTriangle", true, Shape::kPoint, 0.8, 0},
                                           Scenario{"Segment", false, Shape::kGeneral, 2.0, 20},
                                           Scenario{"AxisSegment", false, Shape::kAxisParallel, 1.2, 20},
                                           Scenario{"PointSegment", false, Shape::kPoint, 0.8, 0}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
