#include "geombind/collision/occlusion_index.h"

#include <algorithm>
#include <cmath>
#include <numeric>
#include <utility>

#include "geombind/collision/intersection.h"

namespace TessikSDK::GeomBind::Collision {

namespace {

constexpr std::uint32_t kLeafTriangles = 4;

// Child `i` of an octant, computed as the octree splits: the shared centre value, then the flat-axis pad.
AABB childCell(const AABB& cell, const glm::dvec3& centre, int i) {
  AABB child;
  for (int k = 0; k < 3; ++k) {
    const bool upperHalf = ((i >> k) & 1) != 0;
    child.lower[k] = upperHalf ? centre[k] : cell.lower[k];
    child.upper[k] = upperHalf ? cell.upper[k] : centre[k];
  }
  if (child.lower.x == child.upper.x || child.lower.y == child.upper.y || child.lower.z == child.upper.z) {
    child.inflateFlatAxes();
  }
  return child;
}

bool overlaps(const AABB& a, const AABB& b) { return intersects(a, b); }

}  // namespace

OcclusionIndex::OcclusionIndex(const AABB& bounds, std::vector<Triangle> triangles, std::uint32_t depth)
    : root_(bounds), depth_(depth), triangles_(std::move(triangles)) {
  root_.inflateFlatAxes();
  if (triangles_.empty()) return;

  // A leaf cell's width on each axis, plus room for the rounding of the closed tests and of the repeated
  // halving: coordinates err by a few units in the last place of their magnitude, far below this.
  const glm::dvec3 width = root_.upper - root_.lower;
  const double magnitude =
      std::max({std::fabs(root_.lower.x), std::fabs(root_.lower.y), std::fabs(root_.lower.z),
                std::fabs(root_.upper.x), std::fabs(root_.upper.y), std::fabs(root_.upper.z)});
  const double cells = std::ldexp(1.0, static_cast<int>(std::min<std::uint32_t>(depth_, 1000)));
  glm::dvec3 margin;
  for (int k = 0; k < 3; ++k) margin[k] = width[k] / cells * 1.01 + 1e-9 * (magnitude + width[k]);

  const auto count = static_cast<std::uint32_t>(triangles_.size());
  widened_.reserve(count);
  std::vector<glm::dvec3> centres;
  centres.reserve(count);
  for (const Triangle& t : triangles_) {
    AABB box(t);
    box.lower -= margin;
    box.upper += margin;
    widened_.push_back(box);
    centres.push_back((box.lower + box.upper) * 0.5);
  }
  nodes_.reserve(2 * (count / kLeafTriangles + 1));
  std::vector<std::uint32_t> order(count);
  std::iota(order.begin(), order.end(), 0u);
  buildNode(0, count, centres, order);

  // Leaves list their triangles as consecutive runs: store them in that order.
  std::vector<Triangle> ordered(count);
  std::vector<AABB> orderedWidened(count);
  for (std::uint32_t i = 0; i < count; ++i) {
    ordered[i] = triangles_[order[i]];
    orderedWidened[i] = widened_[order[i]];
  }
  triangles_ = std::move(ordered);
  widened_ = std::move(orderedWidened);
}

std::uint32_t OcclusionIndex::buildNode(std::uint32_t first,
                                        std::uint32_t count,
                                        const std::vector<glm::dvec3>& centres,
                                        std::vector<std::uint32_t>& order) {
  const auto index = static_cast<std::uint32_t>(nodes_.size());
  nodes_.emplace_back();
  AABB box, spread;
  for (std::uint32_t i = first; i < first + count; ++i) {
    box.extend(widened_[order[i]].lower);
    box.extend(widened_[order[i]].upper);
    spread.extend(centres[order[i]]);
  }
  nodes_[index].box = box;
  const glm::dvec3 extent = spread.upper - spread.lower;
  if (count <= kLeafTriangles || (extent.x == 0.0 && extent.y == 0.0 && extent.z == 0.0)) {
    nodes_[index].first = first;
    nodes_[index].count = count;
    return index;
  }

  // Median split on the widest axis of the centres: balanced whatever the triangle sizes.
  const int axis = extent.x >= extent.y && extent.x >= extent.z ? 0 : (extent.y >= extent.z ? 1 : 2);
  const std::uint32_t half = count / 2;
  const auto begin = order.begin() + first;
  std::nth_element(begin, begin + half, begin + count, [&](std::uint32_t a, std::uint32_t b) {
    return centres[a][axis] < centres[b][axis] || (centres[a][axis] == centres[b][axis] && a < b);
  });
  buildNode(first, half, centres, order);
  const std::uint32_t second = buildNode(first + half, count - half, centres, order);
  nodes_[index].second = second;
  return index;
}

bool OcclusionIndex::sharesLeaf(const AABB& cell,
                                std::uint32_t depth,
                                const Segment& segment,
                                const Triangle& triangle) const {
  if (depth >= depth_) return true;
  const glm::dvec3 centre = (cell.lower + cell.upper) * 0.5;
  for (int i = 0; i < 8; ++i) {
    const AABB child = childCell(cell, centre, i);
    if (!intersects(child, triangle) || !intersects(child, segment)) continue;
    if (sharesLeaf(child, depth + 1, segment, triangle)) return true;
  }
  return false;
}

bool OcclusionIndex::blocked(const Segment& segment) const {
  if (nodes_.empty() || !intersects(root_, segment)) return false;
  AABB reach;
  reach.extend(segment.a);
  reach.extend(segment.b);

  // Depth-first over the hierarchy; a balanced tree over 2^32 triangles is under 64 levels deep.
  std::uint32_t stack[64];
  std::size_t top = 0;
  stack[top++] = 0;
  while (top > 0) {
    const Node& node = nodes_[stack[--top]];
    if (!overlaps(node.box, reach) || !intersects(node.box, segment)) continue;
    if (node.count == 0) {
      stack[top++] = node.second;
      stack[top++] = static_cast<std::uint32_t>(&node - nodes_.data()) + 1;
      continue;
    }
    for (std::uint32_t i = node.first; i < node.first + node.count; ++i) {
      if (!overlaps(widened_[i], reach)) continue;
      const Triangle& triangle = triangles_[i];
      if (!intersects(segment, triangle)) continue;
      if (sharesLeaf(root_, 0, segment, triangle)) return true;
    }
  }
  return false;
}

}  // namespace TessikSDK::GeomBind::Collision
