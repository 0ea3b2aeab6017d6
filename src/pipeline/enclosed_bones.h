#pragma once

#include <cstdint>
#include <vector>

#include "tessik/pipeline.h"

#include "pipeline/leaf_tips.h"

namespace TessikSDK::Pipeline {

// A piece the method could not bind even on its own borrows the weights of the nearest bound vertex,
// which suits a shell resting on the body (a button, a strap). A closed piece with a bone inside it is
// different: it is the part that bone carries (an eye around its eye joint, the plate of a robot's
// forearm), and borrowing would hand it to whatever body part happens to be nearest. Each vertex of
// such a piece is given wholly to the nearest of the bones inside it (by distance to the bone's
// segments: joint to each child joint, or to its tip, or the joint alone). A bone is inside a piece
// when its joint or the middle of one of its segments is (winding number of the piece at least 1/2).
// `unbound` flags pieces by the labels of `pieceOf`; `weights` are on the caller's bones. Answers how
// many pieces were given their bones.
std::size_t giveEnclosedBones(const Mesh& mesh,
                              const std::vector<std::uint32_t>& pieceOf,
                              const std::vector<bool>& unbound,
                              const std::vector<Bone>& bones,
                              const std::vector<LeafTip>& tips,
                              Weights& weights);

}  // namespace TessikSDK::Pipeline
