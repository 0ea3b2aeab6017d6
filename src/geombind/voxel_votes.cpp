#include "geombind/voxel_votes.h"

#include <cmath>

#include "geombind/parallel.h"

namespace TessikSDK::GeomBind {

namespace {

using Vec3 = std::array<float, 3>;

Vec3 cross(const Vec3& a, const Vec3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}
float dot(const Vec3& a, const Vec3& b) { return a[0] * b[0] + a[1] * b[1] + a[2] * b[2]; }

}  // namespace

void classifyVotes(IProgress& progress,
                   const AxisVoteGrid& votes,
                   VoxelBitGrid& grid,
                   bool refineInterior,
                   std::vector<std::uint32_t>& ambiguous) {
  const std::int64_t count = static_cast<std::int64_t>(grid.cellCount());
  const std::uint8_t* bytes = votes.votes.data();
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    if (progress.isCanceled()) continue;
    const auto index = static_cast<std::uint64_t>(i);
    if (!grid.testAtomic(index)) {
      const int axisVotes = ((bytes[i] & kAxisVoteMasks[0]) != 0) + ((bytes[i] & kAxisVoteMasks[1]) != 0) +
                            ((bytes[i] & kAxisVoteMasks[2]) != 0);
      if (axisVotes >= 2) {
        grid.setAtomic(index);
      } else if (axisVotes == 1 && refineInterior) {
#pragma omp critical(tessik_ambiguous_voxels)
        ambiguous.push_back(static_cast<std::uint32_t>(i));
      }
    }
    progress.update(static_cast<int>(i));
  }
}

void refineByWindingNumber(IProgress& progress,
                           const MeshData& mesh,
                           const std::vector<std::uint32_t>& ambiguous,
                           VoxelBitGrid& grid,
                           float threshold) {
  const std::uint32_t nx = grid.dims[0], ny = grid.dims[1];
  const glm::dvec3 extent = mesh.boundingBox.upper - mesh.boundingBox.lower;
  const glm::dvec3 d(extent.x / nx, extent.y / ny, extent.z / grid.dims[2]);
  const glm::dvec3 c0 = mesh.boundingBox.lower + d * 0.5;
  const std::int64_t count = static_cast<std::int64_t>(ambiguous.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t j = 0; j < count; ++j) {
    if (progress.isCanceled()) continue;
    const std::uint32_t i = ambiguous[static_cast<std::size_t>(j)];
    const std::uint32_t x = i % nx, y = (i / nx) % ny, z = i / (nx * ny);
    const std::array<float, 3> p = {static_cast<float>(c0.x + x * d.x), static_cast<float>(c0.y + y * d.y),
                                    static_cast<float>(c0.z + z * d.z)};
    if (windingNumber(mesh, p) > threshold) grid.setAtomic(i);
    progress.update(static_cast<int>(j));
  }
}

float windingNumber(const MeshData& mesh, const std::array<float, 3>& p) {
  if (mesh.vertices.empty() || mesh.triangles.empty()) return 0.0f;
  auto rel = [&](std::uint32_t v) {
    const auto& q = mesh.vertices[v].position;
    return Vec3{q[0] - p[0], q[1] - p[1], q[2] - p[2]};
  };
  float sum = 0.0f;
  for (const TriangleRecord& t : mesh.triangles) {
    const Vec3 a = rel(t[0]), b = rel(t[1]), c = rel(t[2]);
    const float la = std::sqrt(dot(a, a)), lb = std::sqrt(dot(b, b)), lc = std::sqrt(dot(c, c));
    // Van Oosterom and Strackee: the solid angle of the triangle seen from p, halved.
    const float numerator = dot(a, cross(b, c));
    const float denominator = la * lb * lc + dot(a, b) * lc + dot(a, c) * lb + dot(b, c) * la;
    sum += std::atan2(numerator, denominator);
  }
  return 2.0f * sum * 0.07957747f;
}

void settleVotes(IProgress& progress,
                 const MeshData& mesh,
                 const AxisVoteGrid& votes,
                 VoxelBitGrid& grid,
                 bool refineInterior,
                 float windingThreshold) {
  std::vector<std::uint32_t> ambiguous;
  classifyVotes(progress, votes, grid, refineInterior, ambiguous);
  if (refineInterior && !ambiguous.empty())
    refineByWindingNumber(progress, mesh, ambiguous, grid, windingThreshold);
}

}  // namespace TessikSDK::GeomBind
