#pragma once

#include <glm/vec3.hpp>

#include "geombind/collision/primitives.h"

// Closed tests between the primitives: touching always counts. Every function is pure, allocates
// nothing and may run on any number of threads at once.
namespace TessikSDK::GeomBind::Collision {

/// The point lies in the closed box (faces, edges and corners included).
bool contains(const AABB& box, const glm::dvec3& p);

/// The two closed boxes overlap; boxes sharing only a face, edge or corner do.
bool intersects(const AABB& first, const AABB& second);

/// Separating-axis test of a segment against a closed box. The cross-product axes carry a tolerance of
/// one machine epsilon so that a segment parallel to a box axis is not rejected by rounding.
bool intersects(const AABB& box, const Segment& segment);

/// The triangle overlaps the closed box (triangleBoxOverlap on the box's centre and half size).
bool intersects(const AABB& box, const Triangle& triangle);

/// Akenine-Moller's separating-axis triangle/box overlap test, without tolerance.
bool triangleBoxOverlap(const glm::dvec3& centre, const glm::dvec3& halfSize, const Triangle& triangle);

/// Whether the infinite line through the segment's end points crosses the triangle. A line through an
/// edge or a vertex only does not count; a line lying in the triangle's plane always does.
bool intersects(const Segment& segment, const Triangle& triangle);

/// The point of the segment nearest to `p`. A segment whose end points coincide answers that point.
glm::dvec3 closestPoint(const glm::dvec3& p, const Segment& segment);

/// Euclidean distance from `p` to the segment; 0 (never NaN) for points on it.
double distance(const glm::dvec3& p, const Segment& segment);

}  // namespace TessikSDK::GeomBind::Collision
