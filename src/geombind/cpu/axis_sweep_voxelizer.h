#pragma once

#include "tessik/geombind.h"

#include "geombind/mesh.h"
#include "geombind/voxel_bit_grid.h"
#include "geombind/voxel_votes.h"

namespace TessikSDK::GeomBind::Cpu {

/// Sets the bit of every voxel of `grid` whose cell lies inside the closed mesh; bits already set stay.
/// The grid spans mesh.boundingBox. Decides what the GPU slice voxelizer decides, without OpenGL: six
/// axis sweeps (a point is inside when the nearest surface it sees is a back face), two axis votes out
/// of three make a voxel inside, and with `refineInterior` voxels with exactly one vote are inside when
/// the winding number at their centre exceeds `windingThreshold`. An empty mesh returns at once; once
/// progress.isCanceled() answers true the remaining work is skipped. Runs one OpenMP worker per
/// processor; the result is the same for any number of workers.
void voxelizeInterior(IProgress& progress,
                      const MeshData& mesh,
                      VoxelBitGrid& grid,
                      bool refineInterior,
                      float windingThreshold);

/// The six sweeps over `votes.dims` cells of mesh.boundingBox: ORs each sweep's flag (kAxisVoteMasks)
/// into the voxels it finds inside. A sweep samples a voxel where the GPU sweep renders it: at the
/// texel centre in the two other axes and on the slice plane of the voxel's face along the sweep
/// axis; slices outside the mesh's extent leave no flags. Uses `threads` workers (0: one per
/// processor); the votes do not depend on it. Rows of rays not yet started when progress.isCanceled()
/// answers true are skipped.
void castAxisVotes(IProgress& progress, const MeshData& mesh, AxisVoteGrid& votes, int threads = 0);

}  // namespace TessikSDK::GeomBind::Cpu
