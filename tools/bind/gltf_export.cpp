#include "gltf_export.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include <tiny_gltf.h>

#include "output_files.h"

namespace tessik::bind {
namespace {

using Vec3d = std::array<double, 3>;
using Quat = std::array<double, 4>;  // x, y, z, w as glTF stores it

constexpr std::size_t kMaxJoints = 65536;  // JOINTS values must fit UNSIGNED_SHORT
// Weights are written as whole multiples of 2^-24: every partial sum of such numbers in [0, 1] is a float, so
// the stored weights add up to exactly 1 in whatever order a reader sums them. Validators sum in float with
// little slack; some Khronos validator versions allow none for vertices with one or two influences.
constexpr std::uint32_t kWeightUnits = 1u << 24;

std::invalid_argument badInput(const std::string& what) {
  return std::invalid_argument("cannot write glTF: " + what);
}

std::string jointLabel(const Skeleton& skeleton, std::size_t j) {
  return "joint " + std::to_string(j) + " '" + skeleton.joints[j].name + "'";
}

double dot(const Vec3d& a, const Vec3d& b) { return a[0] * b[0] + a[1] * b[1] + a[2] * b[2]; }

Vec3d cross(const Vec3d& a, const Vec3d& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}

Vec3d toDouble(const Vec3f& v) { return {v[0], v[1], v[2]}; }

// False, leaving `v` alone, when it has no usable direction.
bool normalize(Vec3d& v) {
  const double length = std::sqrt(dot(v, v));
  if (!std::isfinite(length) || !(length > 1e-30)) return false;
  for (double& c : v) c /= length;
  return true;
}

void checkSkeleton(const Skeleton& skeleton) {
  if (skeleton.joints.empty()) throw badInput("the skeleton has no joints");
  if (skeleton.joints.size() > kMaxJoints)
    throw badInput("the skeleton has " + std::to_string(skeleton.joints.size()) +
                   " joints, glTF holds at most " + std::to_string(kMaxJoints));
  for (std::size_t j = 0; j < skeleton.joints.size(); ++j) {
    const Joint& joint = skeleton.joints[j];
    if (joint.parent < -1 || joint.parent >= static_cast<int>(j))
      throw badInput(jointLabel(skeleton, j) + " has parent " + std::to_string(joint.parent));
    const Mat4& m = joint.bindPose;
    if (!std::all_of(m.begin(), m.end(), [](double v) { return std::isfinite(v); }))
      throw badInput(jointLabel(skeleton, j) + " has a non-finite bind pose");
    // Relative to the linear part only: a far translation must not make a unit rotation look singular.
    double size = 0.0;
    for (int k : {0, 1, 2, 4, 5, 6, 8, 9, 10}) size = std::max(size, std::fabs(m[k]));
    const double det = m[0] * (m[5] * m[10] - m[6] * m[9]) - m[1] * (m[4] * m[10] - m[6] * m[8]) +
                       m[2] * (m[4] * m[9] - m[5] * m[8]);
    if (!(std::fabs(det) > 1e-12 * size * size * size))
      throw badInput(jointLabel(skeleton, j) + " has a singular bind pose");
  }
}

void checkMesh(const SurfaceMesh& mesh) {
  const std::size_t n = mesh.positions.size();
  if (n == 0 || mesh.triangles.empty()) throw badInput("the mesh has no triangles");
  // 0xFFFFFFFF is the primitive-restart index, which glTF forbids.
  if (n >= 0xFFFFFFFFu) throw badInput("the mesh has too many vertices");
  if (!mesh.normals.empty() && mesh.normals.size() != n)
    throw badInput(std::to_string(mesh.normals.size()) + " normals for " + std::to_string(n) + " vertices");
  for (std::size_t v = 0; v < n; ++v)
    for (float c : mesh.positions[v])
      if (!std::isfinite(c)) throw badInput("vertex " + std::to_string(v) + " has a non-finite position");
  for (std::size_t t = 0; t < mesh.triangles.size(); ++t)
    for (std::uint32_t index : mesh.triangles[t])
      if (index >= n)
        throw badInput("triangle " + std::to_string(t) + " uses vertex " + std::to_string(index));
}

void requireBlendableWeights(const VertexWeights& weights, std::size_t numVertices, std::size_t numJoints) {
  // A glTF skin blends every vertex, so each needs some weight.
  const std::string fault = TessikSDK::Pipeline::checkWeights(weights, numVertices, numJoints, true);
  if (!fault.empty()) throw badInput(fault);
}

// Per vertex: its influences as (joint, weight in kWeightUnits), one per joint, summing to kWeightUnits.
struct QuantisedWeights {
  std::vector<std::uint32_t> offsets{0};
  std::vector<std::pair<std::uint32_t, std::uint32_t>> influences;
  std::size_t maxPerVertex = 0;
};

QuantisedWeights quantiseWeights(const VertexWeights& weights) {
  QuantisedWeights out;
  out.influences.reserve(weights.influences.size());
  std::vector<std::pair<std::uint32_t, double>> merged;
  for (std::size_t v = 0; v < weights.numVertices(); ++v) {
    merged.clear();
    for (std::uint32_t i = weights.begin(v); i < weights.end(v); ++i)
      if (weights.influences[i].weight > 0.0f)
        merged.emplace_back(weights.influences[i].bone, weights.influences[i].weight);
    // glTF forbids naming a joint twice for one vertex: add up such repeats.
    std::sort(merged.begin(), merged.end());
    std::size_t unique = 0;
    double total = 0.0;
    for (const auto& [joint, weight] : merged) {
      if (unique > 0 && merged[unique - 1].first == joint)
        merged[unique - 1].second += weight;
      else
        merged[unique++] = {joint, weight};
      total += weight;
    }
    merged.resize(unique);
    std::stable_sort(merged.begin(), merged.end(),
                     [](const auto& a, const auto& b) { return a.second > b.second; });

    // Rounding the others down and giving the rest to the largest keeps every weight positive.
    const std::size_t first = out.influences.size();
    out.influences.emplace_back(merged[0].first, 0);
    std::uint32_t rest = 0;
    for (std::size_t k = 1; k < merged.size(); ++k) {
      const auto units = static_cast<std::uint32_t>(std::floor(merged[k].second / total * kWeightUnits));
      if (units == 0) continue;  // a joint with zero weight must not be named
      out.influences.emplace_back(merged[k].first, units);
      rest += units;
    }
    out.influences[first].second = kWeightUnits - rest;
    out.offsets.push_back(static_cast<std::uint32_t>(out.influences.size()));
    out.maxPerVertex = std::max(out.maxPerVertex, out.influences.size() - first);
  }
  return out;
}

std::vector<float> unitNormals(const SurfaceMesh& mesh) {
  std::vector<float> out;
  out.reserve(3 * mesh.normals.size());
  std::vector<Vec3d> faceSums;  // area-weighted face normals around each vertex, built on first need
  for (std::size_t v = 0; v < mesh.normals.size(); ++v) {
    Vec3d n = toDouble(mesh.normals[v]);
    if (!normalize(n)) {
      if (faceSums.empty()) {
        faceSums.assign(mesh.positions.size(), Vec3d{0.0, 0.0, 0.0});
        for (const auto& t : mesh.triangles) {
          const Vec3d a = toDouble(mesh.positions[t[0]]), b = toDouble(mesh.positions[t[1]]),
                      c = toDouble(mesh.positions[t[2]]);
          const Vec3d face =
              cross({b[0] - a[0], b[1] - a[1], b[2] - a[2]}, {c[0] - a[0], c[1] - a[1], c[2] - a[2]});
          for (std::uint32_t corner : t)
            for (int k = 0; k < 3; ++k) faceSums[corner][k] += face[k];
        }
      }
      n = faceSums[v];
      if (!normalize(n)) n = {0.0, 0.0, 1.0};
    }
    for (double c : n) out.push_back(static_cast<float>(c));
  }
  return out;
}

struct Trs {
  Vec3d translation{};
  Quat rotation{0.0, 0.0, 0.0, 1.0};
  Vec3d scale{1.0, 1.0, 1.0};
};

// Rotation matrix given by its columns; Shepperd's branches keep the square root away from zero.
Quat quaternionOf(const Vec3d& x, const Vec3d& y, const Vec3d& z) {
  const double trace = x[0] + y[1] + z[2];
  Quat q;
  if (trace > 0.0) {
    const double s = 2.0 * std::sqrt(trace + 1.0);
    q = {(y[2] - z[1]) / s, (z[0] - x[2]) / s, (x[1] - y[0]) / s, 0.25 * s};
  } else if (x[0] > y[1] && x[0] > z[2]) {
    const double s = 2.0 * std::sqrt(1.0 + x[0] - y[1] - z[2]);
    q = {0.25 * s, (y[0] + x[1]) / s, (z[0] + x[2]) / s, (y[2] - z[1]) / s};
  } else if (y[1] > z[2]) {
    const double s = 2.0 * std::sqrt(1.0 + y[1] - x[0] - z[2]);
    q = {(y[0] + x[1]) / s, 0.25 * s, (z[1] + y[2]) / s, (z[0] - x[2]) / s};
  } else {
    const double s = 2.0 * std::sqrt(1.0 + z[2] - x[0] - y[1]);
    q = {(z[0] + x[2]) / s, (z[1] + y[2]) / s, 0.25 * s, (x[1] - y[0]) / s};
  }
  const double length = std::sqrt(q[0] * q[0] + q[1] * q[1] + q[2] * q[2] + q[3] * q[3]);
  for (double& c : q) c /= length;
  return q;
}

// Gram-Schmidt (QR) on the linear part: the rotation, and the triangular factor's diagonal as the scale.
// The factor's off-diagonal is shear, which a node cannot hold. A reflection ends up as a negative z scale.
Trs decompose(const Mat4& m) {
  Vec3d x{m[0], m[4], m[8]}, y{m[1], m[5], m[9]};
  const Vec3d c1 = y, c2{m[2], m[6], m[10]};
  Trs trs;
  trs.translation = {m[3], m[7], m[11]};
  trs.scale[0] = std::sqrt(dot(x, x));
  normalize(x);
  const double along = dot(y, x);
  for (int k = 0; k < 3; ++k) y[k] -= along * x[k];
  normalize(y);
  const Vec3d z = cross(x, y);
  trs.scale[1] = dot(c1, y);
  trs.scale[2] = dot(c2, z);
  trs.rotation = quaternionOf(x, y, z);
  // Round-off of the parent's inverse would otherwise write scales like 0.9999999999999997.
  for (double& s : trs.scale)
    if (std::fabs(s - 1.0) < 1e-12) s = 1.0;
  return trs;
}

Mat4 compose(const Trs& trs) {
  const auto [x, y, z, w] = trs.rotation;
  const double r[3][3] = {{1 - 2 * (y * y + z * z), 2 * (x * y - z * w), 2 * (x * z + y * w)},
                          {2 * (x * y + z * w), 1 - 2 * (x * x + z * z), 2 * (y * z - x * w)},
                          {2 * (x * z - y * w), 2 * (y * z + x * w), 1 - 2 * (x * x + y * y)}};
  Mat4 m = identity();
  for (int i = 0; i < 3; ++i) {
    for (int j = 0; j < 3; ++j) m[4 * i + j] = r[i][j] * trs.scale[j];
    m[4 * i + 3] = trs.translation[i];
  }
  return m;
}

class ModelBuilder {
 public:
  ModelBuilder() { model_.buffers.emplace_back(); }

  tinygltf::Model& model() { return model_; }

  // Each accessor gets its own view, at a 4-byte aligned offset, which suits every component type.
  template <class T>
  int addAccessor(const std::vector<T>& values, int componentType, int type, int target) {
    auto& data = model_.buffers[0].data;
    data.resize((data.size() + 3) & ~std::size_t{3});
    const std::size_t components = static_cast<std::size_t>(tinygltf::GetNumComponentsInType(type));

    tinygltf::BufferView view;
    view.buffer = 0;
    view.byteOffset = data.size();
    view.byteLength = values.size() * sizeof(T);
    view.target = target;
    // Not needed with one accessor per view, but stating the tight stride spares readers a guess.
    if (target == TINYGLTF_TARGET_ARRAY_BUFFER) view.byteStride = components * sizeof(T);
    // glTF is little-endian, as are the hosts this tool is built for.
    const auto* bytes = reinterpret_cast<const unsigned char*>(values.data());
    data.insert(data.end(), bytes, bytes + view.byteLength);
    model_.bufferViews.push_back(view);

    tinygltf::Accessor accessor;
    accessor.bufferView = static_cast<int>(model_.bufferViews.size() - 1);
    accessor.componentType = componentType;
    accessor.type = type;
    accessor.count = values.size() / components;
    model_.accessors.push_back(accessor);
    return static_cast<int>(model_.accessors.size() - 1);
  }

 private:
  tinygltf::Model model_;
};

template <class Index>
int addIndices(ModelBuilder& builder, const SurfaceMesh& mesh, int componentType) {
  std::vector<Index> indices;
  indices.reserve(3 * mesh.triangles.size());
  for (const auto& t : mesh.triangles)
    for (std::uint32_t index : t) indices.push_back(static_cast<Index>(index));
  return builder.addAccessor(indices, componentType, TINYGLTF_TYPE_SCALAR,
                             TINYGLTF_TARGET_ELEMENT_ARRAY_BUFFER);
}

// One JOINTS_s/WEIGHTS_s pair per set of four influence slots; unused slots name joint 0 with weight 0.
template <class JointIndex>
void addSkinAttributes(ModelBuilder& builder,
                       const QuantisedWeights& weights,
                       int jointType,
                       tinygltf::Primitive& primitive) {
  const std::size_t numVertices = weights.offsets.size() - 1;
  const std::size_t numSets = (weights.maxPerVertex + 3) / 4;
  for (std::size_t set = 0; set < numSets; ++set) {
    std::vector<JointIndex> joints(4 * numVertices, 0);
    std::vector<float> values(4 * numVertices, 0.0f);
    for (std::size_t v = 0; v < numVertices; ++v)
      for (std::size_t slot = 0; slot < 4; ++slot) {
        const std::size_t i = weights.offsets[v] + 4 * set + slot;
        if (i >= weights.offsets[v + 1]) break;
        joints[4 * v + slot] = static_cast<JointIndex>(weights.influences[i].first);
        values[4 * v + slot] = static_cast<float>(weights.influences[i].second) / kWeightUnits;
      }
    const std::string suffix = "_" + std::to_string(set);
    primitive.attributes["JOINTS" + suffix] =
        builder.addAccessor(joints, jointType, TINYGLTF_TYPE_VEC4, TINYGLTF_TARGET_ARRAY_BUFFER);
    primitive.attributes["WEIGHTS" + suffix] = builder.addAccessor(
        values, TINYGLTF_COMPONENT_TYPE_FLOAT, TINYGLTF_TYPE_VEC4, TINYGLTF_TARGET_ARRAY_BUFFER);
  }
}

tinygltf::Primitive buildPrimitive(ModelBuilder& builder,
                                   const SurfaceMesh& mesh,
                                   const VertexWeights& weights,
                                   std::size_t numJoints) {
  tinygltf::Primitive primitive;
  primitive.mode = TINYGLTF_MODE_TRIANGLES;

  std::vector<float> positions;
  positions.reserve(3 * mesh.positions.size());
  std::vector<double> low(mesh.positions[0].begin(), mesh.positions[0].end()), high = low;
  for (const Vec3f& p : mesh.positions)
    for (int k = 0; k < 3; ++k) {
      positions.push_back(p[k]);
      low[k] = std::min<double>(low[k], p[k]);
      high[k] = std::max<double>(high[k], p[k]);
    }
  const int position = builder.addAccessor(positions, TINYGLTF_COMPONENT_TYPE_FLOAT, TINYGLTF_TYPE_VEC3,
                                           TINYGLTF_TARGET_ARRAY_BUFFER);
  builder.model().accessors[position].minValues = low;
  builder.model().accessors[position].maxValues = high;
  primitive.attributes["POSITION"] = position;

  if (!mesh.normals.empty())
    primitive.attributes["NORMAL"] = builder.addAccessor(unitNormals(mesh), TINYGLTF_COMPONENT_TYPE_FLOAT,
                                                         TINYGLTF_TYPE_VEC3, TINYGLTF_TARGET_ARRAY_BUFFER);

  // 65535 is the UNSIGNED_SHORT restart value, so the short form needs the largest index below it.
  primitive.indices = mesh.positions.size() <= 0xFFFFu
                          ? addIndices<std::uint16_t>(builder, mesh, TINYGLTF_COMPONENT_TYPE_UNSIGNED_SHORT)
                          : addIndices<std::uint32_t>(builder, mesh, TINYGLTF_COMPONENT_TYPE_UNSIGNED_INT);

  const QuantisedWeights quantised = quantiseWeights(weights);
  if (numJoints <= 256)
    addSkinAttributes<std::uint8_t>(builder, quantised, TINYGLTF_COMPONENT_TYPE_UNSIGNED_BYTE, primitive);
  else
    addSkinAttributes<std::uint16_t>(builder, quantised, TINYGLTF_COMPONENT_TYPE_UNSIGNED_SHORT, primitive);
  return primitive;
}

// Joint j becomes node j, and skin 0 lists them in that order. Returns the skeleton's one root node. Each
// local transform is taken against the parent's frame as written, so a frame that lost its shear does not
// throw its descendants off their bind poses.
int addSkeleton(ModelBuilder& builder, const Skeleton& skeleton) {
  tinygltf::Model& model = builder.model();
  const std::size_t numJoints = skeleton.joints.size();
  std::vector<Mat4> world(numJoints), inverseWorld(numJoints);
  std::vector<float> inverseBind;
  inverseBind.reserve(16 * numJoints);
  std::vector<int> roots;
  tinygltf::Skin skin;

  for (std::size_t j = 0; j < numJoints; ++j) {
    const Joint& joint = skeleton.joints[j];
    const Mat4 local =
        joint.parent < 0 ? joint.bindPose : multiply(inverseWorld[joint.parent], joint.bindPose);
    const Trs trs = decompose(local);
    world[j] = joint.parent < 0 ? compose(trs) : multiply(world[joint.parent], compose(trs));
    inverseWorld[j] = inverse(world[j]);
    // Column-major, and the bottom row exactly (0, 0, 0, 1) as glTF demands of an inverse bind matrix.
    for (int column = 0; column < 4; ++column) {
      for (int row = 0; row < 3; ++row)
        inverseBind.push_back(static_cast<float>(inverseWorld[j][4 * row + column]));
      inverseBind.push_back(column == 3 ? 1.0f : 0.0f);
    }

    tinygltf::Node node;
    node.name = joint.name;
    if (trs.translation != Vec3d{0.0, 0.0, 0.0})
      node.translation.assign(trs.translation.begin(), trs.translation.end());
    if (trs.rotation != Quat{0.0, 0.0, 0.0, 1.0})
      node.rotation.assign(trs.rotation.begin(), trs.rotation.end());
    if (trs.scale != Vec3d{1.0, 1.0, 1.0}) node.scale.assign(trs.scale.begin(), trs.scale.end());
    model.nodes.push_back(node);
    if (joint.parent < 0)
      roots.push_back(static_cast<int>(j));
    else
      model.nodes[joint.parent].children.push_back(static_cast<int>(j));
    skin.joints.push_back(static_cast<int>(j));
  }

  skin.inverseBindMatrices =
      builder.addAccessor(inverseBind, TINYGLTF_COMPONENT_TYPE_FLOAT, TINYGLTF_TYPE_MAT4, 0);
  if (roots.size() == 1) {
    skin.skeleton = roots[0];
  } else {
    tinygltf::Node root;
    root.name = "skeleton root";
    root.children = roots;
    model.nodes.push_back(root);
    skin.skeleton = static_cast<int>(model.nodes.size() - 1);
  }
  model.skins.push_back(skin);
  return skin.skeleton;
}

void writeModel(const tinygltf::Model& model, const std::string& path, bool binary) {
  // Serialised in memory (buffers embedded) and written here: tinygltf does not report failed writes.
  std::ostringstream serialised;
  tinygltf::TinyGLTF gltf;
  tinygltf::Model copy = model;  // the stream writer takes a mutable model
  if (!gltf.WriteGltfSceneToStream(&copy, serialised, /*prettyPrint=*/true, binary))
    throw std::runtime_error("cannot write '" + path + "': the model could not be serialised");
  const std::string bytes = serialised.str();
  writeFileChecked(path, bytes.data(), bytes.size());
}

}  // namespace

void writeSkinnedGltf(const std::string& path,
                      const SurfaceMesh& mesh,
                      const Skeleton& skeleton,
                      const VertexWeights& weights,
                      bool binary) {
  checkSkeleton(skeleton);
  checkMesh(mesh);
  requireBlendableWeights(weights, mesh.positions.size(), skeleton.joints.size());

  ModelBuilder builder;
  tinygltf::Model& model = builder.model();
  model.asset.generator = "tessik-bind";
  model.asset.version = "2.0";

  tinygltf::Mesh gltfMesh;
  gltfMesh.name = "mesh";
  gltfMesh.primitives.push_back(buildPrimitive(builder, mesh, weights, skeleton.joints.size()));
  model.meshes.push_back(gltfMesh);

  const int skeletonRoot = addSkeleton(builder, skeleton);
  // At the scene root without a transform: glTF ignores both for a skinned mesh, and validators warn.
  tinygltf::Node meshNode;
  meshNode.name = "mesh";
  meshNode.mesh = 0;
  meshNode.skin = 0;
  model.nodes.push_back(meshNode);
  tinygltf::Scene scene;
  scene.nodes = {static_cast<int>(model.nodes.size() - 1), skeletonRoot};
  model.scenes.push_back(scene);
  model.defaultScene = 0;

  writeModel(model, path, binary);
}

}  // namespace tessik::bind
