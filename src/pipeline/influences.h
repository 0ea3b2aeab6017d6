#pragma once

#include <cstdint>
#include <vector>

#include "tessik/pipeline.h"

namespace TessikSDK::Pipeline {

// Influences that name binding nodes (the caller's bones, then the leaf tips) become influences on the
// caller's bones: `boneOfNode` maps each node to its bone, and a bone named twice (a leaf and its tip)
// gets the sum. Each row is then sorted strongest first (ties by bone index, so that the answer does
// not depend on the order the method listed them), cut to `maxInfluences` (0 keeps all) and scaled to
// sum to 1. Rows left without weight stay empty.
Weights foldAndLimit(const Weights& nodeWeights,
                     const std::vector<std::uint32_t>& boneOfNode,
                     unsigned maxInfluences);

// Rows of vertices with an owner (>= 0) become that one bone at full weight; the others stay.
void giveWholly(const std::vector<std::int64_t>& owner, Weights& weights);

// A vertex no binding reached (a loose vertex, a piece nothing could bind) still needs a weight: it
// follows the nearest joint, which is what a user would paint by hand first. Answers how many there were.
std::size_t giveOrphansNearestJoint(const Mesh& mesh, const std::vector<Bone>& bones, Weights& weights);

}  // namespace TessikSDK::Pipeline
