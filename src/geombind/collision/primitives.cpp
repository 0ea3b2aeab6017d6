#include "geombind/collision/primitives.h"

#include <limits>

#include <glm/geometric.hpp>

namespace TessikSDK::GeomBind::Collision {

AABB::AABB() : lower(std::numeric_limits<double>::max()), upper(-std::numeric_limits<double>::max()) {}

AABB::AABB(const glm::dvec3& lower, const glm::dvec3& upper) : lower(lower), upper(upper) {}

AABB::AABB(const Triangle& triangle) : AABB() {
  extend(triangle.a);
  extend(triangle.b);
  extend(triangle.c);
}

void AABB::extend(const glm::dvec3& p) {
  for (int k = 0; k < 3; ++k) {
    if (p[k] < lower[k]) lower[k] = p[k];
    if (p[k] > upper[k]) upper[k] = p[k];
  }
}

void AABB::inflateFlatAxes() {
  const glm::dvec3 widths = upper - lower;
  // The pad goes through single precision on purpose: voxel and octree boxes built from it must match
  // bit for bit wherever the same box is padded.
  const double pad = static_cast<double>(static_cast<float>(glm::length(widths) * static_cast<double>(0.1f)));
  for (int k = 0; k < 3; ++k) {
    if (widths[k] == 0.0) {
      lower[k] -= pad;
      upper[k] += pad;
    }
  }
}

}  // namespace TessikSDK::GeomBind::Collision
