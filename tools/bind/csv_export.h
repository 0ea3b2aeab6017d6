#pragma once

#include <string>

#include "asset.h"

namespace tessik::bind {

/// Writes the weights as CSV: the header line `vertex,bone,weight`, then one row per influence in vertex
/// order, the bone given by its joint's name (quoted, with inner quotes doubled, when it holds a comma, a
/// quote or a line break) and the weight as stored, in the shortest form that reads back to the same
/// float. Lines end in "\n"; the decimal point is '.' whatever the locale.
///
/// @throws std::invalid_argument, before anything is written, when the offsets are not a valid row table
///         or an influence names a joint outside the skeleton.
/// @throws std::runtime_error when the file cannot be written; no partial file is left behind.
void writeWeightsCsv(const std::string& path, const Skeleton& skeleton, const VertexWeights& weights);

}  // namespace tessik::bind
