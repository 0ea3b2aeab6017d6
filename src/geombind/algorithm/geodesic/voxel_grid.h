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

/// One level of detail: a label per cell, cell (x, y, z) at (z * ny + y) * nx + x. The finest level
/// divides the mesh box into resolution^3 cells. Level d (index 0 the coarsest) is the lattice of the
/// octree's depth-d octants, 2^d cells per axis over octreeBox(); it stores only the cells that reach
/// into the mesh box, so `dims` may be fewer than 2^d and every cell past them counts as Empty.
struct VoxelGrid {
  std::array<std::uint32_t, 3> dims{0, 0, 0};
  std::vector<std::uint8_t> cells;
};

/// Cell index along one axis of a grid of `dim` cells of `size` starting at `lower`: truncation toward
/// zero, limited to dim - 1 (an unsigned comparison, so anything negative past -1 also lands there).
std::uint32_t cellOf(double coordinate, double lower, double size, std::uint32_t dim);

/// The box the octree splits: the mesh box grown on its upper sides to 2^ceilLog2(resolution) cells of
/// the finest grid's size, so that the octants of every depth are exactly the cells of one level. The
/// mesh box itself when the resolution is a power of two (or 1 or less).
Collision::AABB octreeBox(const Collision::AABB& meshBox, std::int32_t resolution);

/// Label of the cell holding `p` in a level whose cells are `size` wide from `lower`: Empty for points
/// past the stored cells on any side.
std::uint8_t labelAt(const VoxelGrid& level,
                     const glm::dvec3& lower,
                     const glm::dvec3& size,
                     const glm::dvec3& p);

/// Sets the bit of every cell a triangle touches (closed box-triangle test), in parallel over triangles.
void voxelizeBoundary(IProgress& progress, const MeshData& mesh, VoxelBitGrid& grid);

/// Gives `label` to every Empty cell whose bit is set.
void stampLabel(VoxelGrid& level, const VoxelBitGrid& bits, VoxelLabel label);

/// The next coarser level: dims halved, rounding up, so that a finer level's odd last cell still has a
/// parent; a cell is Interior when any of its eight children that the finer level stores is not Empty.
VoxelGrid buildCoarserLevel(const VoxelGrid& finer);

/// Where the inside of the mesh is voxelised: by the GPU sweeps through the current OpenGL context, or by
/// the same sweeps on the processor.
enum class InteriorVoxelizer { gpu, cpu };

/// Stage "Compute Voxel Grids and all LODs": the finest level resolution^3 labelled Boundary, Interior
/// or Empty (surface on the CPU, interior by `voxelizer`), then ceilLog2(resolution) coarser levels.
/// Index 0 is the coarsest, a single cell; a level's index is the octree depth it serves.
std::vector<VoxelGrid> buildGridsAndLevels(IProgress& progress,
                                           const MeshData& mesh,
                                           std::int32_t resolution,
                                           bool refineInterior,
                                           InteriorVoxelizer voxelizer = InteriorVoxelizer::gpu);

}  // namespace TessikSDK::GeomBind::Algorithm
