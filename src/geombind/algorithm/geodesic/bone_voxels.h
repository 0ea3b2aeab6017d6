#pragma once

#include <cstdint>
#include <utility>
#include <vector>

#include "tessik/geombind.h"

#include "geombind/algorithm/geodesic/sparse_voxels.h"
#include "geombind/collision/octree.h"
#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind::Algorithm {

constexpr std::uint32_t NoNode = 0xFFFFFFFFu;

/// The bone elements: (parent, child) for every node with a parent, in node order, then (node, NoNode)
/// for every node without children. An element belongs to the bone named first.
std::vector<std::pair<std::uint32_t, std::uint32_t>> collectBoneSegments(const HierarchyData& hierarchy);

/// Joint position of a node: the translation of its transform.
glm::dvec3 jointPosition(const HierarchyData& hierarchy, std::uint32_t node);

/// Per bone, the sparse voxels its segments (or, for a bone without children, its joint) touch. Empty
/// for a bone that lies wholly outside the model.
std::vector<VoxelSet> identifyBoneVoxels(IProgress& progress,
                                         const HierarchyData& hierarchy,
                                         const Collision::Octree& octree,
                                         const VoxelMap& voxelMap);

}  // namespace TessikSDK::GeomBind::Algorithm
