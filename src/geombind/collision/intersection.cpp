#include "geombind/collision/intersection.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include <glm/geometric.hpp>

namespace TessikSDK::GeomBind::Collision {

namespace {

int sign(double v) {
  if (v > 0.0) return 1;
  if (v < 0.0) return -1;
  return 0;
}

// One edge-cross-axis test of the triangle/box overlap: the triangle's two projections against the
// box's projected radius.
bool separatedOnAxis(double p1, double p2, double radius) {
  return std::min(p1, p2) > radius || std::max(p1, p2) < -radius;
}

double projectX(const glm::dvec3& e, const glm::dvec3& q) { return e.z * q.y - e.y * q.z; }
double projectY(const glm::dvec3& e, const glm::dvec3& q) { return e.x * q.z - e.z * q.x; }
double projectZ(const glm::dvec3& e, const glm::dvec3& q) { return e.y * q.x - e.x * q.y; }
double radiusX(const glm::dvec3& e, const glm::dvec3& h) {
  return std::fabs(e.z) * h.y + std::fabs(e.y) * h.z;
}
double radiusY(const glm::dvec3& e, const glm::dvec3& h) {
  return std::fabs(e.z) * h.x + std::fabs(e.x) * h.z;
}
double radiusZ(const glm::dvec3& e, const glm::dvec3& h) {
  return std::fabs(e.y) * h.x + std::fabs(e.x) * h.y;
}

}  // namespace

bool contains(const AABB& box, const glm::dvec3& p) {
  for (int k = 0; k < 3; ++k) {
    if (box.lower[k] > p[k] || p[k] > box.upper[k]) return false;
  }
  return true;
}

bool intersects(const AABB& first, const AABB& second) {
  for (int k = 0; k < 3; ++k) {
    if (second.lower[k] > first.upper[k] || first.lower[k] > second.upper[k]) return false;
  }
  return true;
}

bool intersects(const AABB& box, const Segment& segment) {
  const glm::dvec3 c = (box.lower + box.upper) * 0.5;
  const glm::dvec3 e = (box.upper - box.lower) * 0.5;
  const glm::dvec3 m = (segment.a + segment.b) * 0.5;
  const glm::dvec3 h = segment.b - m;
  const glm::dvec3 d = m - c;
  for (int k = 0; k < 3; ++k) {
    if (std::fabs(d[k]) > std::fabs(h[k]) + e[k]) return false;
  }
  const double eps = std::numeric_limits<double>::epsilon();
  const glm::dvec3 hAbs(std::fabs(h.x) + eps, std::fabs(h.y) + eps, std::fabs(h.z) + eps);
  if (std::fabs(h.z * d.y - h.y * d.z) > e.y * hAbs.z + e.z * hAbs.y) return false;
  if (std::fabs(h.x * d.z - h.z * d.x) > e.x * hAbs.z + e.z * hAbs.x) return false;
  return std::fabs(h.y * d.x - h.x * d.y) <= e.x * hAbs.y + e.y * hAbs.x;
}

bool intersects(const AABB& box, const Triangle& triangle) {
  // Most boxes a tree tests miss a given triangle on a box axis. That axis test, done first with exactly
  // the arithmetic of the full overlap test, rejects them cheaply; the answer cannot differ, since the
  // full test is the conjunction of its axis tests.
  const glm::dvec3 centre = (box.lower + box.upper) * 0.5;
  const glm::dvec3 half = (box.upper - box.lower) * 0.5;
  for (int k = 0; k < 3; ++k) {
    const double q0 = triangle.a[k] - centre[k], q1 = triangle.b[k] - centre[k],
                 q2 = triangle.c[k] - centre[k];
    if (std::min({q0, q1, q2}) > half[k] || std::max({q0, q1, q2}) < -half[k]) return false;
  }
  return triangleBoxOverlap(centre, half, triangle);
}

bool triangleBoxOverlap(const glm::dvec3& centre, const glm::dvec3& h, const Triangle& triangle) {
  const glm::dvec3 q0 = triangle.a - centre;
  const glm::dvec3 q1 = triangle.b - centre;
  const glm::dvec3 q2 = triangle.c - centre;
  const glm::dvec3 e0 = q1 - q0;
  const glm::dvec3 e1 = q2 - q1;
  const glm::dvec3 e2 = q0 - q2;

  // The nine edge x box-axis tests; which two vertices are projected differs per edge and axis
  // because the third always projects onto one of them.
  if (separatedOnAxis(projectX(e0, q0), projectX(e0, q2), radiusX(e0, h))) return false;
  if (separatedOnAxis(projectY(e0, q0), projectY(e0, q2), radiusY(e0, h))) return false;
  if (separatedOnAxis(projectZ(e0, q1), projectZ(e0, q2), radiusZ(e0, h))) return false;
  if (separatedOnAxis(projectX(e1, q0), projectX(e1, q2), radiusX(e1, h))) return false;
  if (separatedOnAxis(projectY(e1, q0), projectY(e1, q2), radiusY(e1, h))) return false;
  if (separatedOnAxis(projectZ(e1, q0), projectZ(e1, q1), radiusZ(e1, h))) return false;
  if (separatedOnAxis(projectX(e2, q0), projectX(e2, q1), radiusX(e2, h))) return false;
  if (separatedOnAxis(projectY(e2, q0), projectY(e2, q1), radiusY(e2, h))) return false;
  if (separatedOnAxis(projectZ(e2, q1), projectZ(e2, q2), radiusZ(e2, h))) return false;

  for (int k = 0; k < 3; ++k) {
    const double lo = std::min({q0[k], q1[k], q2[k]});
    const double hi = std::max({q0[k], q1[k], q2[k]});
    if (lo > h[k] || hi < -h[k]) return false;
  }

  const glm::dvec3 n = glm::cross(e0, e1);
  // A sliver whose normal is nothing but rounding noise is a segment: the nine edge axes and the box
  // axes already decide it, and a noise normal would test an arbitrary plane and miss real overlaps.
  const double noise = 8.0 * std::numeric_limits<double>::epsilon() * glm::length(e0) * glm::length(e1);
  if (glm::length(n) <= noise) return true;
  glm::dvec3 vmin, vmax;
  for (int k = 0; k < 3; ++k) {
    if (n[k] > 0.0) {
      vmin[k] = -h[k] - q0[k];
      vmax[k] = h[k] - q0[k];
    } else {
      vmin[k] = h[k] - q0[k];
      vmax[k] = -h[k] - q0[k];
    }
  }
  return glm::dot(n, vmin) <= 0.0 && glm::dot(n, vmax) >= 0.0;
}

bool intersects(const Segment& segment, const Triangle& triangle) {
  // Pluecker coordinates of the line: the sign of each side value says on which side of a triangle
  // edge the line passes.
  const glm::dvec3 d = segment.b - segment.a;
  const glm::dvec3 m = glm::cross(d, segment.a);
  auto side = [&](const glm::dvec3& u, const glm::dvec3& w) {
    return glm::dot(w - u, m) - glm::dot(glm::cross(u, w), d);
  };
  const int s1 = sign(side(triangle.b, triangle.c));
  const int s2 = sign(side(triangle.c, triangle.a));
  const int s3 = sign(side(triangle.a, triangle.b));
  return s1 == s2 && s2 == s3;
}

glm::dvec3 closestPoint(const glm::dvec3& p, const Segment& segment) {
  const glm::dvec3 ab = segment.b - segment.a;
  const double f = glm::dot(ab, ab);
  if (f == 0.0) return segment.a;  // 0/0 otherwise; both end points are the answer
  double t = glm::dot(p - segment.a, ab) / f;
  if (t < 0.0) t = 0.0;
  if (t > 1.0) t = 1.0;
  return segment.a + t * ab;
}

double distance(const glm::dvec3& p, const Segment& segment) {
  const glm::dvec3 ab = segment.b - segment.a;
  const glm::dvec3 ap = p - segment.a;
  const double t = glm::dot(ap, ab);
  if (t <= 0.0) return glm::length(ap);
  const double f = glm::dot(ab, ab);
  if (t >= f) return glm::length(p - segment.b);
  // Rounding can leave a hair below zero for points on the segment.
  return std::sqrt(std::max(0.0, glm::dot(ap, ap) - t * t / f));
}

}  // namespace TessikSDK::GeomBind::Collision
