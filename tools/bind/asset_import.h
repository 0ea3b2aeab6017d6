#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "asset.h"

namespace tessik::bind {

struct ImportedAsset {
  SurfaceMesh mesh;   // every triangle mesh of the file merged into one, in the skeleton's space
  Skeleton skeleton;  // the file's bones in the bind pose; empty when the file has none
  // The weights the file itself skins `mesh` with, one row per vertex, naming `skeleton` joints and
  // scaled to sum to one; only when the file's bones are used. A reference to compare a binding with.
  std::optional<VertexWeights> fileWeights;
  std::size_t meshesMerged = 0;
  std::size_t meshesSkipped = 0;  // meshes left out: not skinned while others are, or holding no triangles
};

// Reads `path` through assimp. With bones in the file, only skinned meshes are kept, all carried into
// one bind space; without, every mesh is placed by its node's world transform, which is the space a
// `--skeleton` file describes. `ignoreFileSkeleton` takes that second path even when the file has bones.
// A leaf bone whose node has end nodes under it (not bones themselves) gets the farthest of them as its
// tip.
// Throws std::runtime_error with one line when the file is missing, unreadable, rejected by assimp, or
// holds no triangles.
ImportedAsset importAsset(const std::string& path, bool ignoreFileSkeleton);

}  // namespace tessik::bind
