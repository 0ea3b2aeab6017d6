#pragma once

#include <vector>

#include "tessik/geombind.h"

#include "geombind/algorithm/geodesic/sparse_voxels.h"

namespace TessikSDK::GeomBind::Algorithm {

/// Distance every voxel keeps for a bone no path reaches: the largest finite float.
constexpr float kUnreached = 3.4028235e38f;

/// For every bone, the cheapest path cost from its voxels to every sparse voxel, centre to centre along
/// the neighbour lists; a step into a Boundary voxel costs `boundaryCostFactor` times its length.
/// Numbers the voxels (index = list position) and fills their `distances`, one entry per bone. Bones
/// run in parallel; each writes only its own entry.
void computeGeodesicDistances(IProgress& progress,
                              SparseVoxelList& voxels,
                              const std::vector<VoxelSet>& boneVoxels,
                              float boundaryCostFactor);

}  // namespace TessikSDK::GeomBind::Algorithm
