#pragma once

#include <cstdint>
#include <functional>
#include <vector>

#include "tessik/pipeline.h"
#include <tessik/geombind.h>

namespace TessikSDK::Pipeline {

struct PieceBinding {
  Weights weights;                // no vertices when no piece could be bound, or on cancel
  std::size_t unboundPieces = 0;  // pieces that failed even alone, or had no triangle
  std::vector<bool> pieceBound;   // per piece: whether a group holding it was bound
};

// Binds one group of whole pieces; answers no vertices when the group cannot be bound.
using GroupBinder = std::function<Weights(const Mesh& group)>;

// For a surface whose pieces cannot be bound all at once. The heat method fails the whole surface when
// any one piece sees no bone (a shell of eyes or buttons outside the body, whose view of the bones the
// body blocks). Splitting the pieces in halves until each group binds keeps every piece that can be
// bound, in few runs when few pieces fail; a piece that fails even alone takes the weights of the nearest
// bound vertex of another piece, which it usually rests on. `pieceOf` labels each vertex as labelPieces
// does; the whole surface is taken to have failed already. Progress reports pieces done; cancellation
// is read from it between groups.
PieceBinding bindInGroups(const Mesh& mesh,
                          const std::vector<std::uint32_t>& pieceOf,
                          std::size_t pieces,
                          const GroupBinder& bindGroup,
                          TessikSDK::GeomBind::IProgress& progress);

}  // namespace TessikSDK::Pipeline
