#pragma once

#include <memory>
#include <unordered_set>
#include <vector>

#include "geombind/collision/intersection.h"
#include "geombind/collision/octree.h"

// Line of sight the plain way, as the reference the occlusion index must agree with: the triangles in
// an octree built to `depth`, and a walk down the octants the segment touches that stops at the first
// leaf triangle its line crosses.
namespace TessikSDK::GeomBind::Collision::Testing {

class OctreeSight {
 public:
  OctreeSight(const AABB& bounds, const std::vector<Triangle>& triangles, std::uint32_t depth) {
    tree_.reset(bounds);
    for (const Triangle& t : triangles) tree_.add(t);
    tree_.build(0, depth);
  }

  bool blocked(const Segment& segment) const {
    Walk walk(segment);
    tree_.accept(walk);
    return walk.hit;
  }

 private:
  struct Walk : IOctreeConstVisitor {
    explicit Walk(const Segment& s) : segment(s) {}
    void visit(const Octant& octant) override {
      if (hit || !intersects(octant.bounds, segment)) return;
      for (const Octant* child : octant.children()) child->accept(*this);
      for (const IOctreeElement* element : octant.elements()) {
        if (!tested.insert(element).second) continue;
        if (intersects(segment, *element->as<Triangle>())) {
          hit = true;
          return;
        }
      }
    }
    const Segment& segment;
    std::unordered_set<const IOctreeElement*> tested;
    bool hit = false;
  };

  Octree tree_;
};

}  // namespace TessikSDK::GeomBind::Collision::Testing
