#pragma once

#include <cstdint>
#include <vector>

#include "geombind/collision/primitives.h"

namespace TessikSDK::GeomBind::Collision {

/// Line-of-sight queries over a triangle mesh that answer exactly as a walk of the Octree holding the
/// same triangles, built with no minimum depth down to `depth`, would: a segment is blocked when the
/// infinite line through it crosses a triangle (intersects(Segment, Triangle)) that is listed in a leaf
/// the segment's walk reaches. Such an octree grows with the surface area in leaf cells (millions of
/// nodes at depth 10 whatever the triangle count); this index grows with the triangle count.
///
/// Candidates come from a bounding-volume hierarchy over the triangles' boxes widened by one leaf cell;
/// a candidate the line crosses is then checked for a shared leaf by descending the octree's cells that
/// both the segment and the triangle touch, with the octree's own split arithmetic and closed tests. The
/// answers are therefore the octree's bit for bit, boundary ties included: the widening exceeds every
/// cell by a margin far above rounding, so no triangle that could share a leaf is ever left out.
///
/// Immutable once built; `blocked` allocates nothing and may run on any number of threads at once.
class OcclusionIndex {
 public:
  /// An index that blocks nothing.
  OcclusionIndex() = default;
  /// `bounds` is the box the octree would be reset to (its flat axes are padded the same way).
  OcclusionIndex(const AABB& bounds, std::vector<Triangle> triangles, std::uint32_t depth);

  /// Whether a triangle blocks the segment, as described above.
  bool blocked(const Segment& segment) const;

  /// The root cell: `bounds` with its flat axes padded.
  const AABB& bounds() const { return root_; }

 private:
  struct Node {
    AABB box;  // the union of its triangles' widened boxes
    std::uint32_t first = 0;
    std::uint32_t count = 0;   // triangles [first, first + count) for a leaf, 0 for an inner node
    std::uint32_t second = 0;  // an inner node's second child; the first follows it directly
  };

  // Lays out the node over order[first, first + count), reordering that range; returns its index.
  std::uint32_t buildNode(std::uint32_t first,
                          std::uint32_t count,
                          const std::vector<glm::dvec3>& centres,
                          std::vector<std::uint32_t>& order);
  bool sharesLeaf(const AABB& cell,
                  std::uint32_t depth,
                  const Segment& segment,
                  const Triangle& triangle) const;

  AABB root_;
  std::uint32_t depth_ = 0;
  std::vector<Triangle> triangles_;  // in the hierarchy's leaf order
  std::vector<AABB> widened_;        // per triangle, its box grown by one leaf cell and a margin
  std::vector<Node> nodes_;
};

}  // namespace TessikSDK::GeomBind::Collision
