#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "asset.h"

// Posing a bound skeleton and deforming its surface with the library's skin engine, so that a preview can
// show how the weights behave when a joint bends.
namespace tessik::bind {

// A turn of one joint, in degrees, about the joint's own bind-time X, Y and Z axes.
struct JointRotation {
  std::string joint;
  double rx = 0.0;
  double ry = 0.0;
  double rz = 0.0;
};

// Reads "BONE=RX,RY,RZ". The text splits at its last '=', so bone names may themselves contain '=';
// each angle is a finite decimal number, optionally surrounded by spaces.
// Throws std::invalid_argument, one line naming the text, for anything else.
JointRotation parseJointRotation(const std::string& text);

// The joint's turn as a matrix: X first, then Y, then Z, each about the joint's bind-time axes (which do
// not follow the earlier turns), so M = Rz * Ry * Rx in the column-vector convention of Mat4.
Mat4 jointRotationMatrix(const JointRotation& rotation);

// Every joint's frame in mesh space once the rotations are applied, indexed like skeleton.joints. A
// listed joint turns about its own position in its bind-time axes and carries its descendants with it;
// every other joint keeps its bind-time frame relative to its parent, so with no rotations the result
// is exactly each joint's bindPose. When a joint is listed more than once, the last entry wins, as a
// later command-line option overrides an earlier one.
// Throws std::invalid_argument for a bone the skeleton does not have (the first joint of a name is the
// one turned) or for a joint whose parent does not come before it; std::runtime_error when a parent's
// bindPose cannot be inverted.
std::vector<Mat4> posedJointTransforms(const Skeleton& skeleton, const std::vector<JointRotation>& rotations);

// Smooth vertex normals: each vertex's unit-length sum of its triangles' area-weighted normals (counter-
// clockwise winding faces the normal). A vertex on no triangle of non-zero area gets (0, 0, 0).
// Triangle indices must be below positions.size().
std::vector<Vec3f> smoothNormals(const std::vector<Vec3f>& positions,
                                 const std::vector<std::array<std::uint32_t, 3>>& triangles);

// Throws std::invalid_argument, naming the first mismatch, unless the inputs fit together: finite
// positions, normals empty or one per position, triangle indices in range, weights in well-formed rows
// (one per position, finite non-negative weights, joints of the skeleton), one finite joint transform per
// joint, parents before children.
void checkSkinInputs(const SurfaceMesh& mesh,
                     const Skeleton& skeleton,
                     const std::vector<Mat4>& jointTransforms,
                     const VertexWeights& weights);

// The mesh deformed by TessikSDK's linear-blend skin engine: each joint moves from its bindPose to
// posed[joint]. A vertex's weights are scaled to sum to one first, because the engine does not normalise
// and a partly weighted vertex would otherwise be pulled toward the origin; a vertex with no influence,
// or only zero weights, stays where it is. Normals are recomputed from the deformed triangles as
// smoothNormals does (whether or not the input had any); a vertex on no triangle of non-zero area keeps
// its input normal carried along by its joints, or (0, 0, 0) when the input had none.
// Throws std::invalid_argument as checkSkinInputs does, or for more than INT_MAX vertices or joints.
SurfaceMesh deformMesh(const SurfaceMesh& mesh,
                       const Skeleton& skeleton,
                       const std::vector<Mat4>& posed,
                       const VertexWeights& weights);

}  // namespace tessik::bind
