#include "default_character.h"

#include <map>

#include "meshes/character.h"

namespace tessik::bind {

ImportedAsset defaultCharacter() {
  // About 13k vertices: enough to show smooth weight transitions, small enough to bind in seconds.
  const meshes::Character c = meshes::character(0.5);
  ImportedAsset asset;
  asset.mesh.positions = c.mesh.positions;
  asset.mesh.triangles = c.mesh.triangles;
  std::map<std::string, int> index;
  for (const meshes::Bone& b : c.bones) {
    Joint j;
    j.name = b.name;
    j.parent = b.parent.empty() ? -1 : index.at(b.parent);
    j.bindPose = identity();
    j.bindPose[3] = b.position[0];
    j.bindPose[7] = b.position[1];
    j.bindPose[11] = b.position[2];
    index[b.name] = static_cast<int>(asset.skeleton.joints.size());
    asset.skeleton.joints.push_back(j);
  }
  asset.meshesMerged = 1;
  return asset;
}

}  // namespace tessik::bind
