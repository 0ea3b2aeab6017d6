#include <algorithm>
#include <cmath>
#include <memory>
#include <vector>

#include <gtest/gtest.h>

#include "geombind/algorithm/geodesic/bone_voxels.h"
#include "geombind/algorithm/geodesic/geodesic_distances.h"
#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"
#include "geombind/algorithm/geodesic/sparse_voxels.h"
#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/algorithm/geodesic/voxel_weights.h"
#include "geombind/algorithm/weight_lists.h"
#include "geombind/progress.h"

namespace {

using namespace TessikSDK::GeomBind;
using namespace TessikSDK::GeomBind::Algorithm;
using Collision::AABB;

// The unit cube split uniformly to `depth` (a point element forces the build), every level Interior,
// so every leaf becomes a sparse voxel of side 1 / 2^depth.
struct UniformVoxels {
  explicit UniformVoxels(std::uint32_t depth) {
    octree.reset(AABB(glm::dvec3(0), glm::dvec3(1)));
    octree.add(glm::dvec3(0.5));
    octree.build(depth, depth);
    for (std::uint32_t d = 0; d <= depth; ++d) {
      const std::uint32_t n = 1u << d;
      levels.push_back({{n, n, n}, std::vector<std::uint8_t>(std::size_t{n} * n * n, Interior)});
    }
    extractSparseVoxels(octree, levels, voxels, voxelMap);
  }
  // The voxel holding cell (x, y, z) of the finest lattice.
  SparseVoxel* at(int x, int y, int z) const {
    const double side = 1.0 / (1u << (levels.size() - 1));
    return *voxelsTouching(octree, voxelMap, (glm::dvec3(x, y, z) + 0.5) * side).begin();
  }
  Collision::Octree octree;
  std::vector<VoxelGrid> levels;
  SparseVoxelList voxels;
  VoxelMap voxelMap;
};

// A few finest cells of an N^3 grid over the unit box marked Boundary, each with a point element placed
// just inside its lower corner, where a leaf that only roughly matched the cell would take its label from
// a neighbour.
class GeodesicLevels : public ::testing::TestWithParam<int> {};

TEST_P(GeodesicLevels, OctantsOfEveryDepthAreTheCellsOfTheirLevel) {
  const auto n = static_cast<std::uint32_t>(GetParam());
  const auto depth = static_cast<std::uint32_t>(ceilLog2(GetParam()));
  const AABB box(glm::dvec3(0), glm::dvec3(1));
  const std::uint32_t marked[][3] = {{0, 0, 0}, {n / 2 + 1, n - 1, 1}, {n - 1, n - 1, n - 1}};
  std::vector<VoxelGrid> levels(depth + 1);
  levels[depth] = {{n, n, n}, std::vector<std::uint8_t>(std::size_t{n} * n * n, Empty)};
  Collision::Octree octree;
  octree.reset(octreeBox(box, GetParam()));
  for (const auto& c : marked) {
    levels[depth].cells[(std::size_t{c[2]} * n + c[1]) * n + c[0]] = Boundary;
    octree.add((glm::dvec3(c[0], c[1], c[2]) + 0.05) / double(n));
  }
  for (std::uint32_t d = depth; d-- > 0;) levels[d] = buildCoarserLevel(levels[d + 1]);
  for (std::uint32_t d = 0; d <= depth; ++d) {
    const std::uint32_t side = (n + (1u << (depth - d)) - 1) >> (depth - d);
    ASSERT_EQ(levels[d].dims, (std::array<std::uint32_t, 3>{side, side, side})) << "level " << d;
    if (d == depth) continue;
    std::vector<std::uint8_t> expected(levels[d].cells.size(), Empty);
    for (const auto& c : marked) {
      const std::uint32_t x = c[0] >> (depth - d), y = c[1] >> (depth - d), z = c[2] >> (depth - d);
      expected[(std::size_t{z} * side + y) * side + x] = Interior;
    }
    EXPECT_EQ(levels[d].cells, expected) << "level " << d;
  }

  octree.build(0, depth);
  SparseVoxelList voxels;
  VoxelMap voxelMap;
  extractSparseVoxels(octree, levels, voxels, voxelMap);
  EXPECT_EQ(voxels.size(), 3u) << "only the marked cells' leaves; the padding past the mesh box is Empty";
  for (const auto& element : octree.allElements()) {
    const VoxelSet found = voxelsTouching(octree, voxelMap, *element->as<glm::dvec3>());
    ASSERT_EQ(found.size(), 1u) << "a point in a marked cell lies in a voxel";
    const Collision::Octant& leaf = *(*found.begin())->octant;
    EXPECT_EQ(leaf.depth, depth);
    EXPECT_NEAR(leaf.bounds.upper.x - leaf.bounds.lower.x, 1.0 / n, 1e-12)
        << "finest octants are finest cells";
  }
  if ((n & (n - 1)) == 0) {
    const AABB mesh(glm::dvec3(-0.00001), glm::dvec3(1.00001));
    const AABB root = octreeBox(mesh, GetParam());
    EXPECT_TRUE(root.lower == mesh.lower && root.upper == mesh.upper)
        << "powers of two keep the mesh box exactly";
  }
}

INSTANTIATE_TEST_SUITE_P(Geodesic, GeodesicLevels, ::testing::Values(64, 100, 127, 48));

TEST(GeodesicNeighbours, DifferentSizesSharingOnlyACornerAreNeighbours) {
  Collision::Octree octree;
  octree.reset(AABB(glm::dvec3(0), glm::dvec3(1)));
  // Splits only the low octant down to depth 2; the high octant stays one depth-1 leaf.
  octree.add(glm::dvec3(0.3));
  octree.build(1, 2);
  std::vector<VoxelGrid> levels = {{{1, 1, 1}, {Interior}},
                                   {{2, 2, 2}, std::vector<std::uint8_t>(8, Interior)},
                                   {{4, 4, 4}, std::vector<std::uint8_t>(64, Interior)}};
  SparseVoxelList voxels;
  VoxelMap map;
  extractSparseVoxels(octree, levels, voxels, map);
  const SparseVoxel* small = *voxelsTouching(octree, map, glm::dvec3(0.4)).begin();
  const SparseVoxel* big = *voxelsTouching(octree, map, glm::dvec3(0.8)).begin();
  ASSERT_NE(small->octant->depth, big->octant->depth);
  auto lists = [](const SparseVoxel* a, const SparseVoxel* b) {
    return std::find(a->neighbours.begin(), a->neighbours.end(), b) != a->neighbours.end();
  };
  EXPECT_TRUE(lists(small, big));
  EXPECT_TRUE(lists(big, small));
  for (const auto& v : voxels) {
    EXPECT_FALSE(lists(v.get(), v.get()));
    EXPECT_TRUE(std::is_sorted(v->neighbours.begin(), v->neighbours.end(), ByListPosition()));
  }
}

std::array<double, 16> at(double x, double y, double z) {
  return {1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, z, 0, 0, 0, 1};
}

TEST(GeodesicBoneVoxels, ChainAndForkCollectTheVoxelsOfTheirSegments) {
  const UniformVoxels grid(2);  // 4 x 4 x 4 voxels of side 0.25
  const double lo = 0.125, hi = 0.875;
  TransformHierarchyImpl chain;
  chain.addNode("root", at(lo, lo, lo).data(), nullptr);
  chain.addNode("a", at(hi, lo, lo).data(), "root");
  chain.addNode("b", at(hi, hi, lo).data(), "a");
  ProgressImpl quiet;
  const std::vector<VoxelSet> bones = identifyBoneVoxels(quiet, chain.data, grid.octree, grid.voxelMap);
  ASSERT_EQ(bones.size(), 3u);
  EXPECT_EQ(bones[0], (VoxelSet{grid.at(0, 0, 0), grid.at(1, 0, 0), grid.at(2, 0, 0), grid.at(3, 0, 0)}));
  EXPECT_EQ(bones[1], (VoxelSet{grid.at(3, 0, 0), grid.at(3, 1, 0), grid.at(3, 2, 0), grid.at(3, 3, 0)}));
  EXPECT_EQ(bones[2], (VoxelSet{grid.at(3, 3, 0)})) << "a bone without children takes the voxel at its joint";

  TransformHierarchyImpl fork;
  fork.addNode("root", at(lo, lo, lo).data(), nullptr);
  fork.addNode("a", at(hi, lo, lo).data(), "root");
  fork.addNode("b", at(lo, hi, lo).data(), "root");
  const std::vector<VoxelSet> forked = identifyBoneVoxels(quiet, fork.data, grid.octree, grid.voxelMap);
  EXPECT_EQ(forked[0].size(), 7u) << "the union of both segments";
  EXPECT_EQ(collectBoneSegments(fork.data),
            (std::vector<std::pair<std::uint32_t, std::uint32_t>>{{0, 1}, {0, 2}, {1, NoNode}, {2, NoNode}}));
}

TEST(GeodesicDistances, BoundaryStepsCostMoreAndShellsStayUnreached) {
  UniformVoxels grid(2);
  grid.at(1, 0, 0)->label = Boundary;
  // A second bone whose only seed is walled off: its neighbour lists are cut here to make a shell.
  SparseVoxel* island = grid.at(3, 3, 3);
  for (const auto& v : grid.voxels) {
    auto& n = v->neighbours;
    n.erase(std::remove(n.begin(), n.end(), island), n.end());
  }
  island->neighbours.clear();
  ProgressImpl quiet;
  computeGeodesicDistances(quiet, grid.voxels, {VoxelSet{grid.at(0, 0, 0)}, VoxelSet{island}, VoxelSet{}},
                           4.0f);
  EXPECT_EQ(grid.at(0, 0, 0)->distances[0], 0.0f);
  EXPECT_FLOAT_EQ(grid.at(0, 1, 0)->distances[0], 0.25f);
  EXPECT_FLOAT_EQ(grid.at(1, 0, 0)->distances[0], 4.0f * 0.25f) << "entering a Boundary voxel costs 4 x";
  EXPECT_FLOAT_EQ(grid.at(2, 0, 0)->distances[0], 2.0f * 0.25f * std::sqrt(2.0f)) << "paths go around it";
  EXPECT_EQ(island->distances[0], kUnreached);
  EXPECT_EQ(grid.at(0, 0, 0)->distances[1], kUnreached);
  for (const auto& v : grid.voxels) EXPECT_EQ(v->distances[2], kUnreached) << "a bone without voxels";
}

// One voxel at the origin corner of a uniform grid, two bones at distances 0.1 and 0.2 from a vertex at
// the voxel's centre.
VertexWeights twoBoneWeights(double exponent, float d0, float d1) {
  UniformVoxels grid(1);
  for (const auto& v : grid.voxels) v->distances = {d0, d1};
  MeshData mesh;
  mesh.vertices.push_back({{0, 0, 0}, {0.25f, 0.25f, 0.25f}});
  return computeWeights(grid.octree, mesh, grid.voxelMap, 2, exponent);
}

TEST(GeodesicWeights, FalloffExponentSetsTheRatio) {
  for (const auto& [exponent, ratio] : {std::pair<double, double>{5.0, 32.0}, {30.0, std::pow(2.0, 30)}}) {
    const VertexWeights w = twoBoneWeights(exponent, 0.1f, 0.2f);
    ASSERT_EQ(w[0].size(), 2u);
    EXPECT_NEAR(w[0][0].weight / w[0][1].weight, ratio, ratio * 1e-5);
    EXPECT_NEAR(w[0][0].weight + w[0][1].weight, 1.0, 1e-12);
  }
  GeodesicSparseVoxelOptions options;
  for (const auto& [falloff, exponent] : {std::pair<float, double>{0.0f, 5.0}, {0.5f, 17.5}, {1.0f, 30.0}}) {
    options.falloff = falloff;
    EXPECT_EQ(weightExponent(options), exponent);
  }
}

TEST(GeodesicWeights, MissingDistancesCountAsUnreached) {
  // What the weights see when a host's progress object cancelled only the distance stage.
  UniformVoxels grid(1);
  MeshData mesh;
  mesh.vertices.push_back({{0, 0, 0}, {0.25f, 0.25f, 0.25f}});
  const VertexWeights w = computeWeights(grid.octree, mesh, grid.voxelMap, 2, 5.0);
  ASSERT_EQ(w[0].size(), 2u);
  EXPECT_EQ(w[0][0].weight, 0.0);
  EXPECT_EQ(w[0][1].weight, 0.0);
}

TEST(GeodesicWeights, ZeroTotalDistanceSharesTheVertexWithoutNaN) {
  const VertexWeights w = twoBoneWeights(30.0, 0.0f, 0.0f);
  EXPECT_EQ(w[0][0].weight, 0.5);
  EXPECT_EQ(w[0][1].weight, 0.5);
  const VertexWeights one = twoBoneWeights(30.0, 0.0f, 0.3f);
  EXPECT_EQ(one[0][0].weight, 1.0);
  EXPECT_EQ(one[0][1].weight, 0.0);
}

// A path 0 - 1 - 2 along x with vertex 1 at distance 1 from vertex 0 and 3 from vertex 2.
class Smoothing : public ::testing::Test {
 protected:
  void SetUp() override {
    for (float x : {0.0f, 1.0f, 4.0f}) mesh.vertices.push_back({{0, 0, 0}, {x, 0, 0}});
    mesh.vertexNeighbours = IndexRows::fromLists({{1}, {0, 2}, {1}});
    weights = {{{0, 1.0}, {1, 0.0}}, {{0, 0.5}, {1, 0.5}}, {{0, 0.0}, {1, 1.0}}};
  }
  MeshData mesh;
  VertexWeights weights;
};

TEST_F(Smoothing, BlendDividesByTheNeighbourCount) {
  smoothWeights(weights, mesh, 2, 1, 0.7f);
  // Neighbour weights 0.75 and 0.25, divided by m = 2: bone 0 (0.375 - 0.5) 0.7 + 0.5 = 0.4125, bone 1
  // 0.2375, then normalised.
  const double f = 0.699999988079071;
  const double t0 = (0.375 - 0.5) * f + 0.5, t1 = (0.125 - 0.5) * f + 0.5;
  EXPECT_NEAR(weights[1][0].weight, t0 / (t0 + t1), 1e-7);
  EXPECT_NEAR(weights[1][1].weight, t1 / (t0 + t1), 1e-7);
  // A single neighbour weighs 1 - d / d = 0: the vertex keeps 0.3 of each weight, rescaled to its own.
  EXPECT_DOUBLE_EQ(weights[0][0].weight, 1.0);
}

TEST_F(Smoothing, EmptyListsStayEmptyAndCountAsZero) {
  weights[2].clear();
  mesh.vertices[2].position = {1.0f, 0.0f, 0.0f};  // coincides with vertex 1
  mesh.vertices[0].position = {1.0f, 0.0f, 0.0f};  // so vertex 1's neighbours are all at distance 0
  smoothWeights(weights, mesh, 2, 3, 0.7f);
  EXPECT_TRUE(weights[2].empty());
  for (const auto& list : weights)
    for (const auto& w : list) EXPECT_TRUE(std::isfinite(w.weight));
  EXPECT_NEAR(weights[1][0].weight + weights[1][1].weight, 1.0, 1e-12);
}

TEST(WeightLists, TruncateKeepsTheStrongestSortedAndRenormalised) {
  VertexWeights eight(1);
  const double raw[8] = {0.05, 0.2, 0.1, 0.2, 0.15, 0.05, 0.2, 0.05};
  for (std::uint32_t b = 0; b < 8; ++b) eight[0].push_back({b, raw[b]});
  VertexWeights kept = eight;
  truncateWeights(4, kept);
  ASSERT_EQ(kept[0].size(), 4u);
  const std::uint32_t order[4] = {1, 3, 6, 4};  // equal weights by ascending bone index
  double sum = 0.0;
  for (int k = 0; k < 4; ++k) {
    EXPECT_EQ(kept[0][k].boneIndex, order[k]);
    sum += kept[0][k].weight;
  }
  EXPECT_NEAR(sum, 1.0, 1e-12);
  for (std::int32_t limit : {8, 9, 0, -1}) {
    VertexWeights same = eight;
    truncateWeights(limit, same);
    for (std::uint32_t b = 0; b < 8; ++b) EXPECT_EQ(same[0][b].weight, raw[b]) << limit;
  }
  std::vector<BoneWeight> zeros = {{0, 0.0}, {1, 0.0}};
  normalizeWeights(zeros);
  EXPECT_EQ(zeros[1].weight, 0.0);
}

}  // namespace
