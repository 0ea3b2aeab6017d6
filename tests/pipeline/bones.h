#pragma once

#include "tessik/pipeline.h"

namespace TessikSDK::Pipeline {

// A bone whose bind pose is a plain translation to its joint.
inline Bone boneAt(const char* name, int parent, double x, double y = 0.0, double z = 0.0) {
  Bone b;
  b.name = name;
  b.parent = parent;
  b.bindPose = {1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, z, 0, 0, 0, 1};
  return b;
}

}  // namespace TessikSDK::Pipeline
