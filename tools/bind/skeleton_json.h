#pragma once

#include <string>

#include "asset.h"

namespace tessik::bind {

// A skeleton for a mesh that carries none, as JSON: a list of bones in any order,
//   [ { "name": "hip", "parent": null, "matrix": [16 numbers] },
//     { "name": "knee", "parent": "hip", "position": [x, y, z] }, ... ]
// `matrix` is the bone's bind-time frame in the mesh's space, row by row, translation in elements 3, 7 and
// 11; `position` is shorthand for a frame that is only a translation. `parent` is null, "" or absent for a
// root. The result lists parents before children, otherwise in file order.
// Throws std::runtime_error with one line naming the file and the fault: unreadable file, bad JSON, a bone
// without a name or frame, a repeated name, an unknown parent, or parents that form a loop.
Skeleton readSkeletonJson(const std::string& path);
Skeleton parseSkeletonJson(const std::string& text, const std::string& source);

}  // namespace tessik::bind
