#pragma once

#include <cstdint>
#include <memory>
#include <type_traits>
#include <vector>

#include <glm/vec3.hpp>

#include "geombind/collision/primitives.h"

namespace TessikSDK::GeomBind::Collision {

class Octant;

/// Anything the octree can sort: it only has to say whether it touches a closed box. The primitive it
/// stands for, when it is one of the three the library stores, is read through `as`.
class IOctreeElement {
 public:
  virtual ~IOctreeElement();
  virtual bool intersects(const AABB& box) const = 0;

  /// The stored point (glm::dvec3), Segment or Triangle when this element holds one of that type; null
  /// otherwise.
  template <class T>
  const T* as() const;

 protected:
  virtual const glm::dvec3* point() const { return nullptr; }
  virtual const Segment* segment() const { return nullptr; }
  virtual const Triangle* triangle() const { return nullptr; }
};

/// A point, segment or triangle stored in the octree, tested with the matching closed test.
template <class T>
class OctreeElement : public IOctreeElement {
 public:
  explicit OctreeElement(const T& primitive) : primitive(primitive) {}
  bool intersects(const AABB& box) const override;

  T primitive;

 protected:
  const glm::dvec3* point() const override;
  const Segment* segment() const override;
  const Triangle* triangle() const override;
};

template <class T>
const T* IOctreeElement::as() const {
  if constexpr (std::is_same_v<T, glm::dvec3>) {
    return point();
  } else if constexpr (std::is_same_v<T, Segment>) {
    return segment();
  } else {
    static_assert(std::is_same_v<T, Triangle>, "the octree stores points, segments and triangles");
    return triangle();
  }
}

template <class T>
const glm::dvec3* OctreeElement<T>::point() const {
  if constexpr (std::is_same_v<T, glm::dvec3>) return &primitive;
  return nullptr;
}
template <class T>
const Segment* OctreeElement<T>::segment() const {
  if constexpr (std::is_same_v<T, Segment>) return &primitive;
  return nullptr;
}
template <class T>
const Triangle* OctreeElement<T>::triangle() const {
  if constexpr (std::is_same_v<T, Triangle>) return &primitive;
  return nullptr;
}

extern template class OctreeElement<glm::dvec3>;
extern template class OctreeElement<Segment>;
extern template class OctreeElement<Triangle>;

/// Walks an octree from the node it is handed; each visitor decides itself how deep to go.
class IOctreeConstVisitor {
 public:
  virtual ~IOctreeConstVisitor();
  virtual void visit(const Octant& octant) = 0;
};

/// One node: a closed box, its depth (0 at the root) and either no children or exactly eight, child i
/// taking the upper half of the box on x when bit 0 of i is set, on y for bit 1, on z for bit 2.
/// Octants own their children (allocated together, as one block of eight) but not the elements they list.
class Octant {
 public:
  /// Copies `bounds` and pads its flat axes, so a flat mesh still gives leaves with volume.
  Octant(const AABB& bounds, std::uint8_t depth);
  virtual ~Octant();
  Octant(const Octant&) = delete;
  Octant& operator=(const Octant&) = delete;

  /// Hands this octant to the visitor, and nothing else.
  void accept(IOctreeConstVisitor& visitor) const { visitor.visit(*this); }

  /// None, or the eight children in child order.
  const std::vector<const Octant*>& children() const { return children_; }
  /// The elements this octant lists; after a build only leaves list any.
  const std::vector<const IOctreeElement*>& elements() const { return elements_; }

  AABB bounds;
  std::uint8_t depth;

 protected:
  /// Splits octants that hold elements until `depthLimit`, and empty ones until `minDepth`. Elements
  /// move to every child whose closed box they touch; after this only leaves list elements.
  void subdivide(std::uint32_t minDepth, std::uint32_t depthLimit);
  /// Deletes every child (recursively).
  void deleteChildren();

  std::vector<const IOctreeElement*> elements_;

 private:
  Octant() : depth(0) {}  // for the child blocks; split() sets the box and depth
  void split();

  std::vector<const Octant*> children_;
  // Deep trees hold millions of octants: one allocation per eight children instead of eight.
  std::unique_ptr<Octant[]> childBlock_;
};

/// The root octant. It owns every element inserted since the last clear; element pointers stay valid
/// until clear, reset or destruction. Built by one thread; once built, any number of visitors may
/// walk it at the same time.
class Octree : public Octant {
 public:
  /// An empty root box at depth 0: call reset with the bounds of the data before inserting.
  Octree();
  ~Octree() override;

  /// clear, then take `bounds` (flat axes padded) as the root box.
  void reset(const AABB& bounds);
  /// Takes `element` and lists it on the root; null is ignored.
  void insert(std::unique_ptr<IOctreeElement> element);
  /// Stores a copy of a point (glm::dvec3), Segment or Triangle.
  template <class T>
  void add(const T& primitive) {
    insert(std::make_unique<OctreeElement<T>>(primitive));
  }
  /// Discards any previous subdivision and hands the root's elements down (see Octant::subdivide).
  /// Depths above 255 are treated as 255. Building again without new inserts leaves the tree empty:
  /// the first build already moved the elements off the root.
  void build(std::uint32_t minDepth, std::uint32_t depthLimit);
  /// Deletes every child and every element; the root box stays.
  void clear();

  /// Every element inserted since the last clear, in insertion order.
  const std::vector<std::unique_ptr<IOctreeElement>>& allElements() const { return owned_; }

 private:
  std::vector<std::unique_ptr<IOctreeElement>> owned_;
};

}  // namespace TessikSDK::GeomBind::Collision
