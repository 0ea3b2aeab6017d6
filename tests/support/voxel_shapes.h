#pragma once

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <functional>
#include <ostream>
#include <vector>

#include <glm/glm.hpp>

#include "geombind/mesh.h"
#include "geombind/voxel_bit_grid.h"
#include "geombind/voxel_votes.h"
#include "meshes/mesh_builders.h"

// Closed test shapes with their analytic signed distance, in the frame the geodesic method voxelizes
// in, shared by the suites of both interior voxelizers.
namespace tessik::test {

using TessikSDK::GeomBind::MeshData;

// The prepared frame of the geodesic method: positions in the unit cube, the grid over a padded cube.
inline MeshData unitFrameMesh(const meshes::TriMesh& m) {
  MeshData mesh;
  for (const auto& p : m.positions) mesh.vertices.push_back({{0, 0, 0}, p});
  mesh.triangles = m.triangles;
  mesh.boundingBox = TessikSDK::GeomBind::Collision::AABB(glm::dvec3(-0.00001), glm::dvec3(1.00001));
  return mesh;
}

// Any mesh moved and scaled uniformly into the unit cube, as binding prepares it.
inline MeshData fitToUnitFrame(meshes::TriMesh m) {
  std::array<float, 3> lo = m.positions.at(0), hi = lo;
  for (const auto& p : m.positions)
    for (int k = 0; k < 3; ++k) lo[k] = std::min(lo[k], p[k]), hi[k] = std::max(hi[k], p[k]);
  const float scale = 1.0f / std::max({hi[0] - lo[0], hi[1] - lo[1], hi[2] - lo[2]});
  for (auto& p : m.positions)
    for (int k = 0; k < 3; ++k) p[k] = (p[k] - lo[k]) * scale;
  return unitFrameMesh(m);
}

class NoProgress : public TessikSDK::GeomBind::IProgress {
 public:
  void begin(const char*, int, int) override {}
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override { return false; }
  bool isCanceled() override { return canceled; }
  bool canceled = false;
};

inline glm::dvec3 voxelSize(const MeshData& mesh, const std::array<std::uint32_t, 3>& dims) {
  const glm::dvec3 e = mesh.boundingBox.upper - mesh.boundingBox.lower;
  return {e.x / dims[0], e.y / dims[1], e.z / dims[2]};
}

inline glm::dvec3 voxelCentre(const MeshData& mesh,
                              const TessikSDK::GeomBind::VoxelBitGrid& grid,
                              std::uint64_t i) {
  const std::uint64_t nx = grid.dims[0], ny = grid.dims[1];
  const glm::dvec3 index(static_cast<double>(i % nx), static_cast<double>(i / nx % ny),
                         static_cast<double>(i / (nx * ny)));
  return mesh.boundingBox.lower + (index + 0.5) * voxelSize(mesh, grid.dims);
}

// Signed distance of analytic shapes (negative inside): the reference for insideness.
using Sdf = std::function<double(const glm::dvec3&)>;
inline double boxSdf(const glm::dvec3& p, const glm::dvec3& lo, const glm::dvec3& hi) {
  const glm::dvec3 c = (lo + hi) * 0.5, h = (hi - lo) * 0.5, q = glm::abs(p - c) - h;
  return glm::length(glm::max(q, 0.0)) + std::min(std::max(q.x, std::max(q.y, q.z)), 0.0);
}
inline double torusSdf(glm::dvec3 p, const glm::dvec3& c, double R, double r, bool aroundY) {
  p -= c;
  if (aroundY) p = glm::dvec3(p.x, p.z, -p.y);
  return std::hypot(std::hypot(p.x, p.y) - R, p.z) - r;
}

struct ShapeCase {
  const char* name;
  std::function<meshes::TriMesh()> build;
  Sdf sdf;
};

inline void PrintTo(const ShapeCase& c, std::ostream* os) { *os << c.name; }

// Every tessellation stays within 0.001 of its analytic surface.
inline const std::vector<ShapeCase>& shapes() {
  static const std::vector<ShapeCase> cases = {
      {"cube",
       [] {
         return meshes::box({0.2f, 0.25f, 0.3f}, {0.8f, 0.7f, 0.75f});
       },
       [](const glm::dvec3& p) {
         return boxSdf(p, {0.2, 0.25, 0.3}, {0.8, 0.7, 0.75});
       }},
      {"sphere",
       [] {
         return meshes::sphere({0.5f, 0.5f, 0.5f}, 0.4f, 32, 64);
       },
       [](const glm::dvec3& p) { return glm::length(p - glm::dvec3(0.5)) - 0.4; }},
      {"torus",
       [] {
         return meshes::torus({0.5f, 0.5f, 0.5f}, 0.3f, 0.12f, 96, 32);
       },
       [](const glm::dvec3& p) { return torusSdf(p, glm::dvec3(0.5), 0.3, 0.12, false); }},
      {"interlocked_tori",
       [] {
         meshes::TriMesh m = meshes::torus({0.4f, 0.5f, 0.5f}, 0.22f, 0.07f, 96, 24);
         m.append(meshes::torus({0.62f, 0.5f, 0.5f}, 0.22f, 0.07f, 96, 24, true));
         return m;
       },
       [](const glm::dvec3& p) {
         return std::min(torusSdf(p, {0.4, 0.5, 0.5}, 0.22, 0.07, false),
                         torusSdf(p, {0.62, 0.5, 0.5}, 0.22, 0.07, true));
       }},
      {"concave_l",
       [] {
         return meshes::lShape({0.1f, 0.1f, 0.0f}, 0.4f, 0.2f, 0.8f);
       },
       [](const glm::dvec3& p) {
         return std::min(boxSdf(p, {0.1, 0.1, 0.2}, {0.9, 0.5, 0.8}),
                         boxSdf(p, {0.1, 0.1, 0.2}, {0.5, 0.9, 0.8}));
       }}};
  return cases;
}

// An off-centre box over a grid of unequal dimensions, its faces 0.37 and 0.63 of a voxel off the grid
// planes so no sample is borderline: each sweep's flag must sit exactly on the voxels whose sampled face
// point (the lower face along the axis when descending, the upper when ascending) lies in the box, so a
// mirrored or transposed mapping shows. Returns the number of wrong flags.
struct SweepFlagProbe {
  std::array<std::uint32_t, 3> dims = {40, 12, 18};
  MeshData mesh;
  glm::dvec3 lo, hi;

  SweepFlagProbe() {
    const MeshData probe = unitFrameMesh({});
    const glm::dvec3 d = voxelSize(probe, dims);
    lo = probe.boundingBox.lower + glm::dvec3(2.37, 3.63, 5.37) * d;
    hi = probe.boundingBox.lower + glm::dvec3(38.63, 9.37, 11.63) * d;
    mesh = unitFrameMesh(
        meshes::box({float(lo.x), float(lo.y), float(lo.z)}, {float(hi.x), float(hi.y), float(hi.z)}));
  }

  std::size_t mismatches(const TessikSDK::GeomBind::AxisVoteGrid& votes) const {
    const glm::dvec3 d = voxelSize(mesh, dims);
    std::size_t wrong = 0;
    for (std::uint32_t z = 0; z < dims[2]; ++z)
      for (std::uint32_t y = 0; y < dims[1]; ++y)
        for (std::uint32_t x = 0; x < dims[0]; ++x) {
          const glm::dvec3 index(x, y, z);
          for (int axis = 0; axis < 3; ++axis)
            for (int ascending = 0; ascending < 2; ++ascending) {
              glm::dvec3 at = index + 0.5;
              at[axis] = index[axis] + ascending;
              const glm::dvec3 p = mesh.boundingBox.lower + at * d;
              const bool inBox = glm::all(glm::greaterThan(p, lo)) && glm::all(glm::lessThan(p, hi));
              const auto flag = static_cast<std::uint8_t>(1u << (2 * axis + ascending));
              wrong += ((votes.votes[(std::size_t{z} * dims[1] + y) * dims[0] + x] & flag) != 0) != inBox;
            }
        }
    return wrong;
  }
};

}  // namespace tessik::test
