#include "pipeline/enclosed_bones.h"

#include <gtest/gtest.h>

#include "meshes/mesh_builders.h"
#include "pipeline/bones.h"

namespace TessikSDK::Pipeline {
namespace {

// Three boxes along x: A holds the root's joint and was bound; B holds a two-bone chain and C no joint,
// and neither could be bound, so both borrowed the root's weights.
TEST(EnclosedBones, AnUnboundPieceGoesToTheBonesInsideItAndOnlyThen) {
  tessik::meshes::TriMesh boxes = tessik::meshes::box({0, 0, 0}, {1, 1, 1});
  boxes.append(tessik::meshes::box({2, 0, 0}, {3, 1, 1}));
  boxes.append(tessik::meshes::box({4, 0, 0}, {5, 1, 1}));
  const Mesh mesh{boxes.positions, boxes.triangles};
  std::vector<std::uint32_t> pieceOf(mesh.positions.size());
  for (std::size_t v = 0; v < pieceOf.size(); ++v) pieceOf[v] = static_cast<std::uint32_t>(v / 8);
  const std::vector<Bone> bones = {boneAt("root", -1, 0.5, 0.5, 0.5), boneAt("upper", 0, 2.2, 0.5, 0.5),
                                   boneAt("lower", 1, 2.6, 0.5, 0.5)};
  // The lower bone's tip runs on to x = 2.9, so B's far end is nearer it than the upper bone.
  const std::vector<LeafTip> tips = {{2, {2.9, 0.5, 0.5}, false}};
  Weights weights;
  for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
    weights.influences.push_back({0, 1.0});
    weights.offsets.push_back(static_cast<std::uint32_t>(weights.influences.size()));
  }

  EXPECT_EQ(giveEnclosedBones(mesh, pieceOf, {false, true, true}, bones, tips, weights), 1u);
  ASSERT_EQ(weights.numVertices(), mesh.positions.size());
  for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
    ASSERT_EQ(weights.end(v) - weights.begin(v), 1u) << v;
    const Influence& in = weights.influences[weights.begin(v)];
    EXPECT_EQ(in.weight, 1.0);
    const float x = mesh.positions[v][0];
    const std::uint32_t expected = x == 2.0f ? 1u : x == 3.0f ? 2u : 0u;
    EXPECT_EQ(in.bone, expected) << "vertex " << v << " at x = " << x;
  }
}

}  // namespace
}  // namespace TessikSDK::Pipeline
