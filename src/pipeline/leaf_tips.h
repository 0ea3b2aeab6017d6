#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "tessik/pipeline.h"

namespace TessikSDK::Pipeline {

// A binding method gives a bone the part of the surface nearest its segment, and a leaf bone has no
// segment: only its joint, which it shares with its parent's segment. The leaf then at best ties with
// its parent, and a head or a hand without fingers turns half as far as it should. A virtual tip under
// each leaf gives it a segment of its own; its weights are folded back into the leaf afterwards.
struct LeafTip {
  std::uint32_t leaf = 0;  // index into the bones
  std::array<double, 3> position{};
  bool fromSkeleton = false;
};

struct TipPlacement {
  std::vector<LeafTip> tips;
  std::size_t leavesWithoutTip = 0;
};

// Where a tip cast from a leaf joint may end, as a share of where the cast leaves the surface: far
// enough to own the part, short of the surface so that the tip stays inside it.
inline constexpr double kTipReach = 0.9;
// The longest tip, as a multiple of the parent bone's length: a cast that runs down a long part (a leaf
// whose direction happens to point along the body) must not claim what other bones carry.
inline constexpr double kTipLengthCap = 2.5;

// Places the tips. `mesh` must be oriented outward (see orientPiecesOutward) and `bones` checked. A leaf
// takes the skeleton's own tip when it has one, pulled back to kTipReach of the way to the surface if it
// lies beyond it. Otherwise a ray from its joint, continuing the direction from its parent's joint, is
// followed until it leaves the surface, and the tip goes kTipReach of the way there, never farther than
// kTipLengthCap parent lengths. No tip reaches past the plane halfway to any other joint. A leaf gets no
// cast tip when it is a root, when its joint lies outside the surface (the ray would start in the air),
// or when the ray never leaves it (an open surface).
TipPlacement placeLeafTips(const Mesh& mesh, const std::vector<Bone>& bones);

// The generalised winding number of the surface about `point`: about 1 inside a closed outward surface,
// 0 outside, in between near holes.
double windingNumber(const Mesh& mesh, const std::array<double, 3>& point);
// The same over some of the mesh's triangles (one piece, say).
double windingNumber(const std::vector<std::array<float, 3>>& positions,
                     const std::vector<std::array<std::uint32_t, 3>>& triangles,
                     const std::array<double, 3>& point);

}  // namespace TessikSDK::Pipeline
