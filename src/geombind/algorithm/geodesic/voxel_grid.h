#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "tessik/geombind.h"

#include "geombind/collision/primitives.h"
#include "geombind/mesh.h"
#include "geombind/voxel_bit_grid.h"

namespace TessikSDK::GeomBind::Algorithm {

enum VoxelLabel : std::uint8_t { Empty = 0, Interior = 1, Boundary = 2 };

/// One level of detail: a label per cell, cell (x, y, z) at (z * ny + y) * nx + x, over the mesh box.
struct VoxelGrid {
  std::array<std::uint32_t, 3> dims{0, 0, 0};
  std::vector<std::uint8_t> cells;
};

/// Cell index along one axis of a grid of `dim` cells of `size` starting at `lower`: truncation toward
/// zero, limited to dim - 1 (an unsigned comparison, so anything negative past -1 also lands there).
std::uint32_t cellOf(double coordinate, double lower, double size, std::uint32_t dim);

/// The grid's cell holding point `p`, as a linear index.
std::uint64_t cellIndexOf(const glm::dvec3& p,
                          const Collision::AABB& box,
                          const std::array<std::uint32_t, 3>& dims);

/// Sets the bit of every cell a triangle touches (closed box-triangle test), in parallel over triangles.
void voxelizeBoundary(IProgress& progress, const MeshData& mesh, VoxelBitGrid& grid);

/// Gives `label` to every Empty cell whose bit is set.
void stampLabel(VoxelGrid& level, const VoxelBitGrid& bits, VoxelLabel label);

/// The next coarser level: dims halved; a cell is Interior when any of the finer cells holding its
/// eight child centres is not Empty.
VoxelGrid buildCoarserLevel(const VoxelGrid& finer, const Collision::AABB& box);

/// Where the inside of the mesh is voxelised: by the GPU sweeps through the current OpenGL context, or by
/// the same sweeps on the processor.
enum class InteriorVoxelizer { gpu, cpu };

/// Stage "Compute Voxel Grids and all LODs": the finest level resolution^3 labelled Boundary, Interior
/// or Empty (surface on the CPU, interior by `voxelizer`), then ceilLog2(resolution) coarser levels.
/// Index 0 is the coarsest; a level's index is the octree depth it serves.
std::vector<VoxelGrid> buildGridsAndLevels(IProgress& progress,
                                           const MeshData& mesh,
                                           std::int32_t resolution,
                                           bool refineInterior,
                                           InteriorVoxelizer voxelizer = InteriorVoxelizer::gpu);

}  // namespace TessikSDK::GeomBind::Algorithm
