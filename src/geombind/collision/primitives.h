#pragma once

#include <glm/vec3.hpp>

namespace TessikSDK::GeomBind::Collision {

struct Triangle;

/// A closed axis-aligned box. The default box is empty (lower at +max, upper at -max), so that
/// extending it by one point gives exactly that point.
struct AABB {
  glm::dvec3 lower;
  glm::dvec3 upper;

  AABB();
  /// Copies the corners as given, without reordering.
  AABB(const glm::dvec3& lower, const glm::dvec3& upper);
  /// The box of the triangle's three vertices.
  explicit AABB(const Triangle& triangle);

  /// Grows the box to contain `p`.
  void extend(const glm::dvec3& p);
  /// Pads every axis of exactly zero width by a tenth of the box's diagonal (rounded to single
  /// precision) on both sides, so flat meshes still give boxes with volume. A point box, and the empty
  /// default box, stay as they are.
  void inflateFlatAxes();
};

struct Segment {
  glm::dvec3 a;
  glm::dvec3 b;

  Segment() = default;
  Segment(const glm::dvec3& a, const glm::dvec3& b) : a(a), b(b) {}
};

struct Triangle {
  glm::dvec3 a;
  glm::dvec3 b;
  glm::dvec3 c;

  Triangle() = default;
  Triangle(const glm::dvec3& a, const glm::dvec3& b, const glm::dvec3& c) : a(a), b(b), c(c) {}
};

}  // namespace TessikSDK::GeomBind::Collision
