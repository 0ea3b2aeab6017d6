#pragma once

#include <cstdint>

#include "geombind/algorithm/geodesic/sparse_voxels.h"
#include "geombind/collision/octree.h"
#include "geombind/mesh.h"
#include "geombind/sparse_vertex_weights.h"

namespace TessikSDK::GeomBind::Algorithm {

/// Per vertex, one weight per bone, 1 / (voxel distance + distance to the voxel centre)^exponent, scaled
/// to sum 1; a bone no path reaches weighs exactly 0 (all 0 when none reaches the vertex). The vertex takes
/// the first (in list order) sparse voxel whose box contains it; a vertex in no voxel gets an empty list.
/// Bones at total distance 0 (a vertex at the very centre of a seed voxel) share the vertex equally rather
/// than producing infinities. Empty when the octree is unbuilt.
VertexWeights computeWeights(const Collision::Octree& octree,
                             const MeshData& mesh,
                             const VoxelMap& voxelMap,
                             std::uint32_t boneCount,
                             double exponent);

/// Blends every vertex's weights toward those of its mesh neighbours, `passes` times, then normalises.
/// Neighbours weigh 1 - d_j / D (d_j their distance, D the sum) and the blend is divided by the number of
/// neighbours. A missing entry (a neighbour with an empty list) counts as 0 and an empty list stays
/// empty; neighbours all at the vertex itself (D = 0) weigh equally.
void smoothWeights(
    VertexWeights& weights, const MeshData& mesh, std::uint32_t boneCount, std::int32_t passes, float blend);

}  // namespace TessikSDK::GeomBind::Algorithm
