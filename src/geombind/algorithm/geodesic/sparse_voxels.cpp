#include "geombind/algorithm/geodesic/sparse_voxels.h"

#include <cmath>

#include "geombind/collision/intersection.h"
#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

OctreeLeafTraverser::~OctreeLeafTraverser() = default;

void OctreeLeafTraverser::visit(const Collision::Octant& octant) {
  if (!descendInto(octant)) return;
  if (octant.children().empty()) {
    visitLeaf(octant);
    return;
  }
  for (const Collision::Octant* child : octant.children()) child->accept(*this);
}

VoxelExtractor::VoxelExtractor(const Collision::AABB& root,
                               const std::vector<VoxelGrid>& grids,
                               SparseVoxelList& out)
    : rootBounds(root), levels(grids), output(out) {}

bool VoxelExtractor::descendInto(const Collision::Octant&) { return !levels.empty(); }

void VoxelExtractor::visitLeaf(const Collision::Octant& octant) {
  if (octant.depth >= levels.size()) return;
  const VoxelGrid& level = levels[octant.depth];
  // A level with a zero dimension has no cells to look in.
  if (level.cells.empty()) return;
  // Level d holds the octants of depth d, so the leaf's centre lies well inside its own cell and only
  // ever falls past the stored cells for leaves wholly in the padding beyond the mesh box.
  const glm::dvec3 centre = (octant.bounds.lower + octant.bounds.upper) * 0.5;
  const glm::dvec3 size = (rootBounds.upper - rootBounds.lower) / std::ldexp(1.0, octant.depth);
  const std::uint8_t label = labelAt(level, rootBounds.lower, size, centre);
  if (label == Empty) return;
  auto voxel = std::make_unique<SparseVoxel>();
  voxel->label = label;
  voxel->octant = &octant;
  voxel->index = static_cast<std::uint32_t>(output.size());
  output.push_back(std::move(voxel));
}

template <>
bool VoxelIntersector<glm::dvec3>::descendInto(const Collision::Octant& octant) {
  return Collision::contains(octant.bounds, *query);
}

template <>
bool VoxelIntersector<Collision::AABB>::descendInto(const Collision::Octant& octant) {
  return Collision::intersects(octant.bounds, *query);
}

template <>
bool VoxelIntersector<Collision::Segment>::descendInto(const Collision::Octant& octant) {
  return Collision::intersects(octant.bounds, *query);
}

template <class T>
void VoxelIntersector<T>::visitLeaf(const Collision::Octant& octant) {
  const auto found = voxelMap.find(&octant);
  if (found != voxelMap.end()) output.insert(found->second);
}

template class VoxelIntersector<glm::dvec3>;
template class VoxelIntersector<Collision::AABB>;
template class VoxelIntersector<Collision::Segment>;

void extractSparseVoxels(const Collision::Octree& octree,
                         const std::vector<VoxelGrid>& levels,
                         SparseVoxelList& voxels,
                         VoxelMap& voxelMap) {
  voxels.clear();
  voxelMap.clear();
  if (octree.allElements().empty() || octree.children().empty() || levels.empty()) return;
  VoxelExtractor extractor(octree.bounds, levels, voxels);
  octree.accept(extractor);
  for (const auto& voxel : voxels) voxelMap[voxel->octant] = voxel.get();

  const glm::dvec3 extent = octree.bounds.upper - octree.bounds.lower;
  const glm::dvec3 half = extent / std::ldexp(1.0, static_cast<int>(levels.size() - 1)) * 0.5;
  const std::int64_t count = static_cast<std::int64_t>(voxels.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    SparseVoxel& voxel = *voxels[static_cast<std::size_t>(i)];
    // Half a finest cell reaches exactly the leaves sharing a face, an edge or a corner.
    const Collision::AABB grown(voxel.octant->bounds.lower - half, voxel.octant->bounds.upper + half);
    VoxelSet touching = voxelsTouching(octree, voxelMap, grown);
    touching.erase(&voxel);
    voxel.neighbours.assign(touching.begin(), touching.end());
  }
}

}  // namespace TessikSDK::GeomBind::Algorithm
