#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"

#include <algorithm>
#include <array>
#include <iostream>

#include "diagnostics/stage_profiler.h"
#include "geombind/algorithm/geodesic/bone_voxels.h"
#include "geombind/algorithm/geodesic/geodesic_distances.h"
#include "geombind/algorithm/geodesic/sparse_voxels.h"
#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/algorithm/geodesic/voxel_weights.h"
#include "geombind/algorithm/weight_lists.h"
#include "geombind/collision/octree.h"

namespace TessikSDK::GeomBind::Algorithm {

namespace {

// Blend of each smoothing pass toward the neighbours' average.
constexpr float kSmoothingBlend = 0.7f;

}  // namespace

void computeOctree(IProgress& progress,
                   const MeshData& mesh,
                   const HierarchyData& hierarchy,
                   std::int32_t resolution,
                   Collision::Octree& octree) {
  octree.reset(octreeBox(mesh.boundingBox, resolution));
  const int triangleCount = static_cast<int>(mesh.triangles.size());
  progress.begin("Computing Octree ... ", triangleCount, 0);
  for (const TriangleRecord& t : mesh.triangles) {
    octree.add(triangleOf(mesh, t));
    progress.update(0);
    if (progress.isCanceled()) return;
  }
  progress.update(triangleCount);

  const auto elements = collectBoneSegments(hierarchy);
  const int elementCount = static_cast<int>(elements.size());
  progress.setRange(elementCount, 0);
  for (const auto& [node, other] : elements) {
    const glm::dvec3 joint = jointPosition(hierarchy, node);
    if (other == NoNode) {
      octree.add(joint);
    } else {
      octree.add(Collision::Segment(joint, jointPosition(hierarchy, other)));
    }
    progress.update(0);
    if (progress.isCanceled()) return;
  }
  octree.build(0, static_cast<std::uint32_t>(ceilLog2(resolution)));
  progress.update(elementCount);
  progress.end();
}

std::int32_t ceilLog2(std::int32_t n) {
  if (n <= 1) return 0;
  std::uint32_t v = static_cast<std::uint32_t>(n - 1);
  std::int32_t bits = 0;
  while (v != 0) {
    ++bits;
    v >>= 1;
  }
  return bits;
}

std::int32_t smoothingIterationsFor(std::int32_t resolution) {
  static constexpr std::array<std::int32_t, 5> kPasses = {4, 4, 3, 2, 2};
  const std::int32_t index = std::max(ceilLog2(resolution) - 6, 0);
  return kPasses[static_cast<std::size_t>(std::min<std::int32_t>(index, kPasses.size() - 1))];
}

double weightExponent(const GeodesicSparseVoxelOptions& options) {
  const float exponent = options.lowFalloffExponent +
                         (options.highFalloffExponent - options.lowFalloffExponent) * options.falloff;
  return static_cast<double>(exponent);
}

GeodesicSparseVoxelBind::~GeodesicSparseVoxelBind() = default;

VertexWeights GeodesicSparseVoxelBind::bind(const MeshData& mesh,
                                            HierarchyData& hierarchy,
                                            const IBindOptions& baseOptions,
                                            IProgress& progress) {
  const auto* options = dynamic_cast<const GeodesicSparseVoxelOptions*>(&baseOptions);
  // A single cell cannot tell bones apart, and the octree would not split at all.
  if (options == nullptr || options->resolution <= 1) return {};

  Diagnostics::StageProfiler& profiler = Diagnostics::stageProfiler();
  profiler.reset();
  auto stage = [&profiler](const char* label, auto&& work) {
    const auto timer = static_cast<std::uint32_t>(profiler.startTimer(label));
    work();
    profiler.stopTimer(timer);
  };

  Collision::Octree octree;
  stage("Compute Octree", [&] { computeOctree(progress, mesh, hierarchy, options->resolution, octree); });

  progress.begin("Voxelizing model ... ", 40, 0);
  std::vector<VoxelGrid> levels;
  stage("Compute Voxel Grids and all LODs", [&] {
    if (!progress.isCanceled())
      levels = buildGridsAndLevels(progress, mesh, options->resolution, options->refineInterior,
                                   options->voxelizer);
  });

  progress.begin("Extracting sparse voxels ... ", 50, 0);
  SparseVoxelList voxels;
  VoxelMap voxelMap;
  stage("Extract Sparse Voxels", [&] {
    if (!progress.isCanceled()) extractSparseVoxels(octree, levels, voxels, voxelMap);
  });
  progress.update(60);
  progress.end();
  // The finest grid is the largest piece of working data; nothing after extraction reads the levels.
  std::vector<VoxelGrid>().swap(levels);

  stage("Compute Geodesic Distances", [&] {
    std::vector<VoxelSet> boneVoxels;
    if (!progress.isCanceled()) boneVoxels = identifyBoneVoxels(progress, hierarchy, octree, voxelMap);
    if (!progress.isCanceled())
      computeGeodesicDistances(progress, voxels, boneVoxels, options->boundaryCostFactor);
  });

  VertexWeights weights;
  stage("Compute Weights", [&] {
    if (!progress.isCanceled()) {
      weights = computeWeights(octree, mesh, voxelMap, hierarchy.nodeCount(), weightExponent(*options));
    }
  });
  stage("Smooth Weights", [&] {
    if (!progress.isCanceled()) {
      smoothWeights(weights, mesh, hierarchy.nodeCount(), options->smoothingIterations, kSmoothingBlend);
    }
  });
  stage("Truncate Weights", [&] {
    if (!progress.isCanceled()) truncateWeights(options->influenceLimit, weights);
  });

  if (consoleReports()) Diagnostics::report(std::cout, profiler) << std::endl << std::endl;
  return weights;
}

}  // namespace TessikSDK::GeomBind::Algorithm
