#include "geombind/collision/octree.h"

#include <algorithm>
#include <utility>

#include "geombind/collision/intersection.h"

namespace TessikSDK::GeomBind::Collision {

IOctreeElement::~IOctreeElement() = default;

namespace {

bool touches(const AABB& box, const glm::dvec3& point) { return contains(box, point); }
bool touches(const AABB& box, const Segment& segment) { return intersects(box, segment); }
bool touches(const AABB& box, const Triangle& triangle) { return intersects(box, triangle); }

}  // namespace

template <class T>
bool OctreeElement<T>::intersects(const AABB& box) const {
  return touches(box, primitive);
}

template class OctreeElement<glm::dvec3>;
template class OctreeElement<Segment>;
template class OctreeElement<Triangle>;

IOctreeConstVisitor::~IOctreeConstVisitor() = default;

Octant::Octant(const AABB& box, std::uint8_t depth) : bounds(box), depth(depth) { bounds.inflateFlatAxes(); }

Octant::~Octant() = default;

void Octant::split() {
  children.reserve(8);
  const glm::dvec3 c = (bounds.lower + bounds.upper) * 0.5;
  for (int i = 0; i < 8; ++i) {
    AABB box;
    for (int k = 0; k < 3; ++k) {
      // Neighbouring children share the exact centre value, so the closed tests agree on faces.
      const bool upperHalf = ((i >> k) & 1) != 0;
      box.lower[k] = upperHalf ? c[k] : bounds.lower[k];
      box.upper[k] = upperHalf ? bounds.upper[k] : c[k];
    }
    children.push_back(std::make_unique<Octant>(box, static_cast<std::uint8_t>(depth + 1)));
  }
}

void Octant::subdivide(std::uint32_t minDepth, std::uint32_t depthLimit) {
  if (depth >= depthLimit) return;
  split();
  for (const auto& child : children) {
    for (IOctreeElement* element : elements) {
      if (element->intersects(child->bounds)) child->elements.push_back(element);
    }
  }
  elements.clear();
  elements.shrink_to_fit();
  for (const auto& child : children) {
    if (child->elements.empty() && child->depth >= minDepth) continue;
    child->subdivide(minDepth, depthLimit);
  }
}

Octree::Octree() : Octant(AABB(), 0) {}

Octree::~Octree() { clear(); }

void Octree::reset(const AABB& box) {
  clear();
  bounds = box;
  bounds.inflateFlatAxes();
}

void Octree::insert(IOctreeElement* element) {
  if (element == nullptr) return;
  // Owned before anything can throw, so a failed append cannot leak it.
  std::unique_ptr<IOctreeElement> owned(element);
  allElements.push_back(std::move(owned));
  elements.push_back(element);
}

void Octree::build(std::uint32_t minDepth, std::uint32_t depthLimit) {
  // Octant depths are 8-bit; deeper limits could never be reached and would wrap the child depth.
  constexpr std::uint32_t kDeepest = 255;
  children.clear();
  subdivide(std::min(minDepth, kDeepest), std::min(depthLimit, kDeepest));
}

void Octree::clear() {
  children.clear();
  elements.clear();
  allElements.clear();
}

}  // namespace TessikSDK::GeomBind::Collision
