#pragma once

#include <array>
#include <cstdint>
#include <vector>

namespace TessikSDK::GeomBind {

/// One bit per cell of a dense nx x ny x nz grid over the mesh box. Cell (x, y, z) has the linear index
/// (z * ny + y) * nx + x and is bit (index mod 32), from the least significant end, of word index / 32.
struct VoxelBitGrid {
  std::array<std::uint32_t, 3> dims{0, 0, 0};
  std::vector<std::uint32_t> bits;

  VoxelBitGrid() = default;
  VoxelBitGrid(std::uint32_t nx, std::uint32_t ny, std::uint32_t nz)
      : dims{nx, ny, nz}, bits(static_cast<std::size_t>((std::uint64_t{nx} * ny * nz + 31) / 32), 0u) {}

  std::uint64_t cellCount() const { return std::uint64_t{dims[0]} * dims[1] * dims[2]; }
  std::uint64_t cellIndex(std::uint32_t x, std::uint32_t y, std::uint32_t z) const {
    return (std::uint64_t{z} * dims[1] + y) * dims[0] + x;
  }

  bool test(std::uint64_t index) const { return ((bits[index / 32] >> (index % 32)) & 1u) != 0; }
  void set(std::uint64_t index) { bits[index / 32] |= 1u << (index % 32); }
  /// For loops where other threads set bits of the same word meanwhile.
  bool testAtomic(std::uint64_t index) const {
    return ((__atomic_load_n(&bits[index / 32], __ATOMIC_RELAXED) >> (index % 32)) & 1u) != 0;
  }
  /// Safe against other threads setting bits of the same word at the same time.
  void setAtomic(std::uint64_t index) {
    __atomic_fetch_or(&bits[index / 32], 1u << (index % 32), __ATOMIC_RELAXED);
  }
};

}  // namespace TessikSDK::GeomBind
