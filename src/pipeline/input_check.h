#pragma once

#include <string>
#include <vector>

#include "tessik/pipeline.h"

namespace TessikSDK::Pipeline {

// The first fault of the mesh or the bones as one line, or an empty string. Everything the later steps
// index by (triangle corners, parents) is in range afterwards, every number is finite, the parents form
// a forest, and the names can be handed to the binding hierarchy, which resolves parents by name.
std::string checkMesh(const Mesh& mesh);
std::string checkBones(const std::vector<Bone>& bones);
// For a mesh and bones that pass the checks above: a fault when no joint lies within the mesh's bounding
// box (grown by a tenth of its diagonal). Such a skeleton is in another space or unit than the mesh, and
// binding would quietly give every vertex wholly to its nearest bone.
std::string checkSkeletonMeetsMesh(const Mesh& mesh, const std::vector<Bone>& bones);

}  // namespace TessikSDK::Pipeline
