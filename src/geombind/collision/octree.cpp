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

void Octant::deleteChildren() {
  children_.clear();
  childBlock_.reset();
}

void Octant::split() {
  childBlock_.reset(new Octant[8]);
  children_.reserve(8);
  const glm::dvec3 c = (bounds.lower + bounds.upper) * 0.5;
  for (int i = 0; i < 8; ++i) {
    Octant& child = childBlock_[i];
    for (int k = 0; k < 3; ++k) {
      // Neighbouring children share the exact centre value, so the closed tests agree on faces.
      const bool upperHalf = ((i >> k) & 1) != 0;
      child.bounds.lower[k] = upperHalf ? c[k] : bounds.lower[k];
      child.bounds.upper[k] = upperHalf ? bounds.upper[k] : c[k];
    }
    child.bounds.inflateFlatAxes();
    child.depth = static_cast<std::uint8_t>(depth + 1);
    children_.push_back(&child);
  }
}

void Octant::subdivide(std::uint32_t minDepth, std::uint32_t depthLimit) {
  if (depth >= depthLimit) return;
  split();
  // Each element meets each child box once; the answers are kept so every child list is allocated at
  // its final size, in element order.
  std::vector<std::uint8_t> touched(elements_.size(), 0);
  std::size_t counts[8] = {};
  for (std::size_t e = 0; e < elements_.size(); ++e) {
    for (int i = 0; i < 8; ++i) {
      if (elements_[e]->intersects(childBlock_[i].bounds)) {
        touched[e] = static_cast<std::uint8_t>(touched[e] | (1u << i));
        ++counts[i];
      }
    }
  }
  for (int i = 0; i < 8; ++i) {
    std::vector<const IOctreeElement*>& list = childBlock_[i].elements_;
    list.reserve(counts[i]);
    for (std::size_t e = 0; e < elements_.size(); ++e) {
      if ((touched[e] >> i) & 1u) list.push_back(elements_[e]);
    }
  }
  std::vector<std::uint8_t>().swap(touched);
  std::vector<const IOctreeElement*>().swap(elements_);
  for (int i = 0; i < 8; ++i) {
    Octant& child = childBlock_[i];
    if (child.elements_.empty() && child.depth >= minDepth) continue;
    child.subdivide(minDepth, depthLimit);
  }
}

Octree::Octree() : Octant(AABB(), 0) {}

Octree::~Octree() { clear(); }

void Octree::reset(const AABB& box) {
  clear();
  bounds = box;
  bounds.inflateFlatAxes();
}

void Octree::insert(std::unique_ptr<IOctreeElement> element) {
  if (element == nullptr) return;
  owned_.push_back(std::move(element));
  try {
    elements_.push_back(owned_.back().get());
  } catch (...) {
    owned_.pop_back();  // not listed, so not kept either
    throw;
  }
}

void Octree::build(std::uint32_t minDepth, std::uint32_t depthLimit) {
  // Octant depths are 8-bit; deeper limits could never be reached and would wrap the child depth.
  constexpr std::uint32_t kDeepest = 255;
  deleteChildren();
  subdivide(std::min(minDepth, kDeepest), std::min(depthLimit, kDeepest));
}

void Octree::clear() {
  deleteChildren();
  elements_.clear();
  owned_.clear();
}

}  // namespace TessikSDK::GeomBind::Collision
