#include "pose.h"

#include <charconv>
#include <climits>
#include <cmath>
#include <cstddef>
#include <stdexcept>
#include <system_error>

#include <tessik/corvane.h>
#include <tessik/geom.h>

namespace tessik::bind {

namespace {

using TessikSDK::Geom::Matrix3;
using TessikSDK::Geom::Point3;

constexpr double kPi = 3.14159265358979323846;

[[noreturn]] void badRotation(const std::string& text, const std::string& why) {
  throw std::invalid_argument("bad joint rotation '" + text + "': " + why +
                              " (expected BONE=RX,RY,RZ in degrees, e.g. l_elbow=0,0,90)");
}

double parseAngle(const std::string& text, std::string part) {
  const std::size_t first = part.find_first_not_of(' ');
  const std::size_t last = part.find_last_not_of(' ');
  part = first == std::string::npos ? std::string() : part.substr(first, last - first + 1);
  // from_chars rejects a leading '+', which people do write for angles.
  const std::size_t skip = part.size() > 1 && part[0] == '+' && part[1] != '-' ? 1 : 0;
  double value = 0.0;
  const char* end = part.data() + part.size();
  const auto [ptr, ec] = std::from_chars(part.data() + skip, end, value);
  if (part.empty() || ec != std::errc() || ptr != end || !std::isfinite(value))
    badRotation(text, "'" + part + "' is not a finite number");
  return value;
}

Matrix3 toMatrix3(const Mat4& m) { return TessikSDK::Geom::Matrix3FromRowMajor4x4(m.data()); }

Vec3f normalized(const std::array<double, 3>& v) {
  const double length = std::sqrt(v[0] * v[0] + v[1] * v[1] + v[2] * v[2]);
  if (!(length > 0.0)) return {0.0f, 0.0f, 0.0f};
  return {static_cast<float>(v[0] / length), static_cast<float>(v[1] / length),
          static_cast<float>(v[2] / length)};
}

[[noreturn]] void badInput(const std::string& why) { throw std::invalid_argument(why); }

}  // namespace

JointRotation parseJointRotation(const std::string& text) {
  const std::size_t equals = text.rfind('=');
  if (equals == std::string::npos) badRotation(text, "no '=' between bone and angles");
  if (equals == 0) badRotation(text, "no bone name before '='");
  std::vector<std::string> parts;
  std::size_t start = equals + 1;
  for (std::size_t comma; (comma = text.find(',', start)) != std::string::npos; start = comma + 1)
    parts.push_back(text.substr(start, comma - start));
  parts.push_back(text.substr(start));
  if (parts.size() != 3) badRotation(text, "needs exactly three angles");
  return {text.substr(0, equals), parseAngle(text, parts[0]), parseAngle(text, parts[1]),
          parseAngle(text, parts[2])};
}

Mat4 jointRotationMatrix(const JointRotation& rotation) {
  const double x = rotation.rx * kPi / 180.0, y = rotation.ry * kPi / 180.0, z = rotation.rz * kPi / 180.0;
  const Mat4 rx{1, 0, 0, 0, 0, std::cos(x), -std::sin(x), 0, 0, std::sin(x), std::cos(x), 0, 0, 0, 0, 1};
  const Mat4 ry{std::cos(y), 0, std::sin(y), 0, 0, 1, 0, 0, -std::sin(y), 0, std::cos(y), 0, 0, 0, 0, 1};
  const Mat4 rz{std::cos(z), -std::sin(z), 0, 0, std::sin(z), std::cos(z), 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
  return multiply(rz, multiply(ry, rx));
}

std::vector<Mat4> posedJointTransforms(const Skeleton& skeleton,
                                       const std::vector<JointRotation>& rotations) {
  const std::vector<Joint>& joints = skeleton.joints;
  std::vector<const JointRotation*> turn(joints.size(), nullptr);
  for (const JointRotation& rotation : rotations) {
    std::size_t j = 0;
    while (j < joints.size() && joints[j].name != rotation.joint) ++j;
    if (j == joints.size())
      throw std::invalid_argument("the pose names bone '" + rotation.joint +
                                  "', which the skeleton does not have");
    turn[j] = &rotation;
  }

  std::vector<Mat4> world(joints.size());
  // A joint whose chain has not turned keeps its bindPose bit for bit, so an empty pose deforms nothing.
  std::vector<bool> moved(joints.size(), false);
  for (std::size_t j = 0; j < joints.size(); ++j) {
    const int parent = joints[j].parent;
    if (parent < -1 || parent >= static_cast<int>(j))
      badInput("joint '" + joints[j].name + "' has a parent that does not come before it");
    moved[j] = turn[j] != nullptr || (parent >= 0 && moved[parent]);
    if (!moved[j]) {
      world[j] = joints[j].bindPose;
      continue;
    }
    Mat4 frame = joints[j].bindPose;
    if (parent >= 0 && moved[parent])
      frame = multiply(world[parent], multiply(inverse(joints[parent].bindPose), frame));
    world[j] = turn[j] != nullptr ? multiply(frame, jointRotationMatrix(*turn[j])) : frame;
  }
  return world;
}

std::vector<Vec3f> smoothNormals(const std::vector<Vec3f>& positions,
                                 const std::vector<std::array<std::uint32_t, 3>>& triangles) {
  std::vector<std::array<double, 3>> sums(positions.size(), {0.0, 0.0, 0.0});
  for (const auto& t : triangles) {
    const Vec3f& a = positions[t[0]];
    const Vec3f& b = positions[t[1]];
    const Vec3f& c = positions[t[2]];
    const double u[3] = {double(b[0]) - a[0], double(b[1]) - a[1], double(b[2]) - a[2]};
    const double v[3] = {double(c[0]) - a[0], double(c[1]) - a[1], double(c[2]) - a[2]};
    // Unnormalised, the cross product's length is twice the area: that is the weighting.
    const double n[3] = {u[1] * v[2] - u[2] * v[1], u[2] * v[0] - u[0] * v[2], u[0] * v[1] - u[1] * v[0]};
    for (std::uint32_t corner : t)
      for (int k = 0; k < 3; ++k) sums[corner][k] += n[k];
  }
  std::vector<Vec3f> normals(positions.size());
  for (std::size_t i = 0; i < positions.size(); ++i) normals[i] = normalized(sums[i]);
  return normals;
}

void checkSkinInputs(const SurfaceMesh& mesh,
                     const Skeleton& skeleton,
                     const std::vector<Mat4>& jointTransforms,
                     const VertexWeights& weights) {
  const std::size_t n = mesh.positions.size();
  for (const Vec3f& p : mesh.positions)
    if (!std::isfinite(p[0]) || !std::isfinite(p[1]) || !std::isfinite(p[2]))
      badInput("the mesh has a position that is not finite");
  if (!mesh.normals.empty() && mesh.normals.size() != n)
    badInput("the mesh has " + std::to_string(mesh.normals.size()) + " normals for " + std::to_string(n) +
             " positions");
  for (const auto& t : mesh.triangles)
    for (std::uint32_t corner : t)
      if (corner >= n)
        badInput("a triangle uses vertex " + std::to_string(corner) + " of " + std::to_string(n));
  const std::size_t numJoints = skeleton.joints.size();
  const std::string fault = TessikSDK::Pipeline::checkWeights(weights, n, numJoints);
  if (!fault.empty()) badInput(fault);
  if (jointTransforms.size() != numJoints)
    badInput("there are " + std::to_string(jointTransforms.size()) + " joint transforms for " +
             std::to_string(numJoints) + " joints");
  for (const Mat4& m : jointTransforms)
    for (double e : m)
      if (!std::isfinite(e)) badInput("a joint transform has an element that is not finite");
  for (std::size_t j = 0; j < numJoints; ++j)
    if (skeleton.joints[j].parent < -1 || skeleton.joints[j].parent >= static_cast<int>(j))
      badInput("joint '" + skeleton.joints[j].name + "' has a parent that does not come before it");
}

SurfaceMesh deformMesh(const SurfaceMesh& mesh,
                       const Skeleton& skeleton,
                       const std::vector<Mat4>& posed,
                       const VertexWeights& weights) {
  checkSkinInputs(mesh, skeleton, posed, weights);
  if (mesh.positions.size() > INT_MAX || skeleton.joints.size() > INT_MAX)
    badInput("the skin engine takes at most " + std::to_string(INT_MAX) + " vertices and joints");
  const int numPoints = static_cast<int>(mesh.positions.size());
  const int numJoints = static_cast<int>(skeleton.joints.size());

  TessikSDK::Corvane::CCorvane engine;
  engine.SetNumBones(numJoints);
  engine.SetNumPoints(numPoints);
  engine.SetInitTM(Matrix3());
  for (int j = 0; j < numJoints; ++j) {
    engine.SetInitBoneTM(j, toMatrix3(skeleton.joints[j].bindPose));
    engine.SetBoneTM(j, toMatrix3(posed[j]));
  }
  // The engine only points at these streams, so they must outlive every MapPoint below.
  std::vector<int> boneIDs(weights.influences.size());
  std::vector<float> boneWeights(weights.influences.size());
  std::vector<bool> influenced(mesh.positions.size(), false);
  for (int v = 0; v < numPoints; ++v) {
    const std::uint32_t begin = weights.begin(v), end = weights.end(v);
    double total = 0.0;
    for (std::uint32_t i = begin; i < end; ++i) total += weights.influences[i].weight;
    if (!(total > 0.0)) continue;
    for (std::uint32_t i = begin; i < end; ++i) {
      boneIDs[i] = static_cast<int>(weights.influences[i].bone);
      boneWeights[i] = static_cast<float>(weights.influences[i].weight / total);
    }
    engine.SetPointData(v, static_cast<int>(end - begin), sizeof(int), &boneIDs[begin], sizeof(float),
                        &boneWeights[begin], 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr, 0, nullptr);
    influenced[v] = true;
  }
  engine.PreComputeBoneXFormTMs();

  SurfaceMesh out;
  out.positions = mesh.positions;
  out.triangles = mesh.triangles;
  for (int v = 0; v < numPoints; ++v) {
    if (!influenced[v]) continue;
    Vec3f in = mesh.positions[v];
    engine.MapPoint(v, in.data(), out.positions[v].data());
  }
  out.normals = smoothNormals(out.positions, out.triangles);
  if (mesh.normals.empty()) return out;
  for (int v = 0; v < numPoints; ++v) {
    if (out.normals[v] != Vec3f{0.0f, 0.0f, 0.0f}) continue;
    if (!influenced[v]) {
      out.normals[v] = mesh.normals[v];
      continue;
    }
    // The blend is affine in the point, so mapping the tip of the normal and subtracting the mapped base
    // applies the blended linear part alone.
    const Vec3f& p = mesh.positions[v];
    const Vec3f& n = mesh.normals[v];
    Vec3f tip = {p[0] + n[0], p[1] + n[1], p[2] + n[2]};
    engine.MapPoint(v, tip.data(), tip.data());
    const Vec3f& q = out.positions[v];
    out.normals[v] = normalized({double(tip[0]) - q[0], double(tip[1]) - q[1], double(tip[2]) - q[2]});
  }
  return out;
}

}  // namespace tessik::bind
