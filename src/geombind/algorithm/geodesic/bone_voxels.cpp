#include "geombind/algorithm/geodesic/bone_voxels.h"

namespace TessikSDK::GeomBind::Algorithm {

std::vector<std::pair<std::uint32_t, std::uint32_t>> collectBoneSegments(const HierarchyData& hierarchy) {
  const std::uint32_t count = hierarchy.nodeCount();
  std::vector<bool> hasChild(count, false);
  std::vector<std::pair<std::uint32_t, std::uint32_t>> elements;
  for (std::uint32_t i = 0; i < count; ++i) {
    const auto parent = static_cast<std::uint32_t>(hierarchy.parentIndex(i));
    if (parent == NoNode) continue;
    elements.emplace_back(parent, i);
    hasChild[parent] = true;
  }
  for (std::uint32_t i = 0; i < count; ++i) {
    if (!hasChild[i]) elements.emplace_back(i, NoNode);
  }
  return elements;
}

glm::dvec3 jointPosition(const HierarchyData& hierarchy, std::uint32_t node) {
  const Matrix4& m = hierarchy.transforms[node];
  return {m[12], m[13], m[14]};
}

std::vector<VoxelSet> identifyBoneVoxels(IProgress& progress,
                                         const HierarchyData& hierarchy,
                                         const Collision::Octree& octree,
                                         const VoxelMap& voxelMap) {
  std::vector<VoxelSet> bones;
  const auto elements = collectBoneSegments(hierarchy);
  const int count = static_cast<int>(elements.size());
  if (count == 0) return bones;
  progress.begin("Identifying Bone Voxels ... ", count, 0);
  bones.resize(hierarchy.nodeCount());
  for (int i = 0; i < count; ++i) {
    const auto [node, other] = elements[static_cast<std::size_t>(i)];
    const glm::dvec3 joint = jointPosition(hierarchy, node);
    const VoxelSet touched =
        other == NoNode
            ? voxelsTouching(octree, voxelMap, joint)
            : voxelsTouching(octree, voxelMap, Collision::Segment(joint, jointPosition(hierarchy, other)));
    bones[node].insert(touched.begin(), touched.end());
    progress.update(i);
  }
  progress.update(count);
  progress.end();
  return bones;
}

}  // namespace TessikSDK::GeomBind::Algorithm
