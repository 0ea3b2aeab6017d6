#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "tessik/geombind.h"

#include "geombind/mesh.h"
#include "geombind/voxel_bit_grid.h"

namespace TessikSDK::GeomBind {

/// One byte per voxel, in the cell order of VoxelBitGrid: the flags of the six axis sweeps that found
/// the voxel inside.
struct AxisVoteGrid {
  std::array<std::uint32_t, 3> dims{0, 0, 0};
  std::vector<std::uint8_t> votes;
};

/// Sweep flags: X descending 1, ascending 2; Y 4 and 8; Z 16 and 32. An axis votes with either flag.
constexpr std::uint8_t kAxisVoteMasks[3] = {3, 12, 48};

/// Generalised winding number of the mesh at `p` (signed solid angle / 4 pi, single precision): 1
/// inside a closed outward-wound mesh, 0 outside, 0 for an empty mesh.
float windingNumber(const MeshData& mesh, const std::array<float, 3>& p);

/// Sets the bit of every voxel without one whose votes come from two or three axes; with
/// `refineInterior`, lists the voxels with exactly one vote in `ambiguous` (in no particular order).
void classifyVotes(IProgress& progress,
                   const AxisVoteGrid& votes,
                   VoxelBitGrid& grid,
                   bool refineInterior,
                   std::vector<std::uint32_t>& ambiguous);

/// Sets the bit of each listed voxel whose centre has a winding number above `threshold`.
void refineByWindingNumber(IProgress& progress,
                           const MeshData& mesh,
                           const std::vector<std::uint32_t>& ambiguous,
                           VoxelBitGrid& grid,
                           float threshold);

/// What both interior voxelizers do once their sweeps have voted: two axes make a voxel inside, and
/// with `refineInterior` the winding number settles the voxels only one axis calls inside.
void settleVotes(IProgress& progress,
                 const MeshData& mesh,
                 const AxisVoteGrid& votes,
                 VoxelBitGrid& grid,
                 bool refineInterior,
                 float windingThreshold);

}  // namespace TessikSDK::GeomBind
