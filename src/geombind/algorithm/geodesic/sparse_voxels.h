#pragma once

#include <cstdint>
#include <memory>
#include <set>
#include <unordered_map>
#include <vector>

#include <glm/vec3.hpp>

#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/collision/octree.h"

namespace TessikSDK::GeomBind::Algorithm {

/// One non-empty leaf of the octree: the graph node of the distance propagation.
struct SparseVoxel {
  std::uint8_t label = Empty;
  const Collision::Octant* octant = nullptr;
  /// Position in the sparse voxel list; sets and neighbour lists are ordered by it, so results never
  /// depend on where records happen to be allocated.
  std::uint32_t index = 0;
  std::vector<SparseVoxel*> neighbours;
  std::vector<float> distances;  ///< per bone
};

struct ByListPosition {
  bool operator()(const SparseVoxel* a, const SparseVoxel* b) const { return a->index < b->index; }
};
using VoxelSet = std::set<SparseVoxel*, ByListPosition>;
using SparseVoxelList = std::vector<std::unique_ptr<SparseVoxel>>;
using VoxelMap = std::unordered_map<const Collision::Octant*, SparseVoxel*>;

/// Walks down while descendInto allows, and hands every leaf reached to visitLeaf.
class OctreeLeafTraverser : public Collision::IOctreeConstVisitor {
 public:
  ~OctreeLeafTraverser() override;
  void visit(const Collision::Octant& octant) override;
  virtual bool descendInto(const Collision::Octant& octant) = 0;
  virtual void visitLeaf(const Collision::Octant& octant) = 0;
};

/// Collects a sparse voxel for every leaf whose cell in the level of the leaf's depth is not Empty; level
/// d is taken as 2^d cells per axis over `rootBounds`.
class VoxelExtractor : public OctreeLeafTraverser {
 public:
  VoxelExtractor(const Collision::AABB& rootBounds,
                 const std::vector<VoxelGrid>& levels,
                 SparseVoxelList& output);
  bool descendInto(const Collision::Octant& octant) override;
  void visitLeaf(const Collision::Octant& octant) override;

 private:
  Collision::AABB rootBounds;
  const std::vector<VoxelGrid>& levels;
  SparseVoxelList& output;
};

/// Collects every sparse voxel whose leaf box the query (point, box or segment) touches.
template <class T>
class VoxelIntersector : public OctreeLeafTraverser {
 public:
  VoxelIntersector(const T& query, const VoxelMap& voxelMap, VoxelSet& output)
      : query(&query), voxelMap(voxelMap), output(output) {}
  bool descendInto(const Collision::Octant& octant) override;
  void visitLeaf(const Collision::Octant& octant) override;

 private:
  const T* query;
  const VoxelMap& voxelMap;
  VoxelSet& output;
};

template <>
bool VoxelIntersector<glm::dvec3>::descendInto(const Collision::Octant& octant);
template <>
bool VoxelIntersector<Collision::AABB>::descendInto(const Collision::Octant& octant);
template <>
bool VoxelIntersector<Collision::Segment>::descendInto(const Collision::Octant& octant);

extern template class VoxelIntersector<glm::dvec3>;
extern template class VoxelIntersector<Collision::AABB>;
extern template class VoxelIntersector<Collision::Segment>;

/// The sparse voxels of the octree's non-empty leaves, numbered in leaf order, each with the voxels
/// whose boxes touch its own (faces, edges or corners). Nothing when the octree is unbuilt or there are
/// no levels.
void extractSparseVoxels(const Collision::Octree& octree,
                         const std::vector<VoxelGrid>& levels,
                         SparseVoxelList& voxels,
                         VoxelMap& voxelMap);

/// Every sparse voxel `query` touches, in list order.
template <class T>
VoxelSet voxelsTouching(const Collision::Octree& octree, const VoxelMap& voxelMap, const T& query) {
  VoxelSet found;
  VoxelIntersector<T> intersector(query, voxelMap, found);
  octree.accept(intersector);
  return found;
}

}  // namespace TessikSDK::GeomBind::Algorithm
