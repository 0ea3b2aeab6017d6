#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include <glm/vec3.hpp>

#include "geombind/collision/primitives.h"

namespace TessikSDK::GeomBind::Collision {

class Octant;

/// Anything the octree can sort: it only has to say whether it touches a closed box.
class IOctreeElement {
 public:
  virtual ~IOctreeElement();
  virtual bool intersects(const AABB& box) const = 0;
};

/// A point, segment or triangle stored in the octree, tested with the matching closed test.
template <class T>
class OctreeElement : public IOctreeElement {
 public:
  explicit OctreeElement(const T& primitive) : primitive(primitive) {}
  bool intersects(const AABB& box) const override;

  T primitive;
};

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

  AABB bounds;
  std::uint8_t depth;
  std::vector<Octant*> children;  ///< empty, or the eight octants of childBlock in child order
  std::vector<IOctreeElement*> elements;

 protected:
  /// Splits octants that hold elements until `depthLimit`, and empty ones until `minDepth`. Elements
  /// move to every child whose closed box they touch; after this only leaves list elements.
  void subdivide(std::uint32_t minDepth, std::uint32_t depthLimit);
  /// Deletes every child (recursively).
  void deleteChildren();

 private:
  Octant() : depth(0) {}  // for the child blocks; split() sets the box and depth
  void split();

  // Deep trees hold millions of octants: one allocation per eight children instead of eight.
  std::unique_ptr<Octant[]> childBlock;
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
  /// Takes ownership of `element` and lists it on the root; null is ignored.
  void insert(IOctreeElement* element);
  /// Discards any previous subdivision and hands the root's elements down (see Octant::subdivide).
  /// Depths above 255 are treated as 255. Building again without new inserts leaves the tree empty:
  /// the first build already moved the elements off the root.
  void build(std::uint32_t minDepth, std::uint32_t depthLimit);
  /// Deletes every child and every element; the root box stays.
  void clear();

  /// Every element inserted since the last clear, in insertion order.
  std::vector<std::unique_ptr<IOctreeElement>> allElements;
};

}  // namespace TessikSDK::GeomBind::Collision
