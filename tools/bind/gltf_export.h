#pragma once

#include <string>

#include "asset.h"

namespace tessik::bind {

/// Writes the mesh skinned to the skeleton as one self-contained glTF 2.0 file: binary GLB when `binary`,
/// else .gltf JSON with the buffer embedded as a base64 data URI.
///
/// Layout: one mesh with one triangle primitive (POSITION, NORMAL when the mesh has normals, indices,
/// JOINTS_n/WEIGHTS_n in as many sets of four as the most influenced vertex needs) on a node at the scene
/// root without a transform, and one skin whose joint i is Skeleton joint i, so JOINTS values are Skeleton
/// joint indices. Each joint is a node named after it with a local translation/rotation/scale; when the
/// skeleton has several roots an extra identity node named "skeleton root" parents them, because glTF
/// wants every skin's joints under one common root.
///
/// Bind poses without shear are written exactly and their inverse bind matrices are inverse(bindPose).
/// Shear cannot be held by a node's translation/rotation/scale: such a joint's frame loses its shear, and its
/// inverse bind matrix inverts the frame as written, so the mesh still renders exactly in bind pose.
///
/// Per vertex the influences of one joint are merged, zero weights are dropped and the rest are scaled to
/// sum to one; they are stored as multiples of 2^-24 so that their float sum is exactly one in any order.
/// Normals are normalised; a zero or non-finite one is replaced by the direction of the surrounding
/// faces (or +Z).
///
/// @pre every vertex has at least one influence with a positive weight: glTF cannot hold an unskinned
///      vertex in a skinned primitive.
/// @throws std::invalid_argument, before anything is written, when the input breaks that or any other
///         part of its contract: weights.numVertices() != positions.size(), normals neither empty nor one
///         per position, an empty mesh or skeleton, a triangle or influence index out of range, a
///         negative or non-finite weight, position or bind pose, a singular bind pose, a parent index not
///         before its child, or more than 65536 joints.
/// @throws std::runtime_error when the file cannot be written; no partial file is left behind.
void writeSkinnedGltf(const std::string& path,
                      const SurfaceMesh& mesh,
                      const Skeleton& skeleton,
                      const VertexWeights& weights,
                      bool binary);

}  // namespace tessik::bind
