#pragma once

#include <cstddef>
#include <string>

#include "asset.h"

namespace tessik::bind {

struct ImportedAsset {
  SurfaceMesh mesh;   // every triangle mesh of the file merged into one, in the skeleton's space
  Skeleton skeleton;  // the file's bones in the bind pose; empty when the file has none
  std::size_t meshesMerged = 0;
  std::size_t meshesSkipped = 0;  // meshes left out: not skinned while others are, or holding no triangles
};

// Reads `path` through assimp. With bones in the file, only skinned meshes are kept, all carried into
// one bind space; without, every mesh is placed by its node's world transform, which is the space a
// `--skeleton` file describes. `ignoreFileSkeleton` takes that second path even when the file has bones.
// Throws std::runtime_error with one line when the file is missing, unreadable, rejected by assimp, or
// holds no triangles.
ImportedAsset importAsset(const std::string& path, bool ignoreFileSkeleton);

}  // namespace tessik::bind
