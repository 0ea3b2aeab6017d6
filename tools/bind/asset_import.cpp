#include "asset_import.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <stdexcept>
#include <utility>
#include <vector>

#include <assimp/Importer.hpp>
#include <assimp/postprocess.h>
#include <assimp/scene.h>

namespace tessik::bind {
namespace {

Mat4 toMat4(const aiMatrix4x4& m) {
  return {m.a1, m.a2, m.a3, m.a4, m.b1, m.b2, m.b3, m.b4, m.c1, m.c2, m.c3, m.c4, m.d1, m.d2, m.d3, m.d4};
}

Mat4 worldTransform(const aiNode* node) {
  Mat4 world = identity();
  for (; node != nullptr; node = node->mParent) world = multiply(toMat4(node->mTransformation), world);
  return world;
}

bool hasTriangles(const aiMesh* mesh) {
  for (unsigned f = 0; f < mesh->mNumFaces; ++f)
    if (mesh->mFaces[f].mNumIndices == 3) return true;
  return false;
}

// Normals go through the inverse transpose so that non-uniform scale keeps them perpendicular.
Mat4 normalMatrix(const Mat4& m) {
  const Mat4 inv = inverse(m);
  Mat4 t{};
  for (int i = 0; i < 4; ++i)
    for (int j = 0; j < 4; ++j) t[4 * i + j] = inv[4 * j + i];
  return t;
}

void appendMesh(const aiMesh* src, const Mat4& toTarget, SurfaceMesh& dst) {
  const auto base = static_cast<std::uint32_t>(dst.positions.size());
  const Mat4 normals = normalMatrix(toTarget);
  for (unsigned v = 0; v < src->mNumVertices; ++v) {
    const aiVector3D& p = src->mVertices[v];
    dst.positions.push_back(transformPoint(toTarget, {p.x, p.y, p.z}));
    Vec3f n{0.0f, 0.0f, 0.0f};
    if (src->mNormals != nullptr)
      n = transformVector(normals, {src->mNormals[v].x, src->mNormals[v].y, src->mNormals[v].z});
    dst.normals.push_back(n);
  }
  for (unsigned f = 0; f < src->mNumFaces; ++f) {
    const aiFace& face = src->mFaces[f];
    if (face.mNumIndices != 3) continue;  // points and lines left over by triangulation
    for (unsigned k = 0; k < 3; ++k)
      if (face.mIndices[k] >= src->mNumVertices)
        throw std::runtime_error(std::string("mesh '") + src->mName.C_Str() +
                                 "' has a triangle naming vertex " + std::to_string(face.mIndices[k]) +
                                 " of " + std::to_string(src->mNumVertices));
    dst.triangles.push_back({base + face.mIndices[0], base + face.mIndices[1], base + face.mIndices[2]});
  }
}

// Every mesh instance in the node tree with its world transform; a mesh referenced by several nodes is
// placed once per node, as a renderer would draw it.
void collectInstances(const aiNode* node, std::vector<std::pair<unsigned, Mat4>>& out) {
  const Mat4 world = worldTransform(node);
  for (unsigned i = 0; i < node->mNumMeshes; ++i) out.emplace_back(node->mMeshes[i], world);
  for (unsigned c = 0; c < node->mNumChildren; ++c) collectInstances(node->mChildren[c], out);
}

// Bones are ordered by a walk of the node tree so that parents come first; a bone's parent is its
// nearest ancestor node that is itself a bone.
void orderJoints(const aiNode* node,
                 int parent,
                 const std::map<std::string, Mat4>& bindPoses,
                 Skeleton& skeleton) {
  const std::string name = node->mName.C_Str();
  const auto it = bindPoses.find(name);
  if (it != bindPoses.end()) {
    skeleton.joints.push_back({name, parent, it->second, {}});
    parent = static_cast<int>(skeleton.joints.size()) - 1;
  }
  for (unsigned c = 0; c < node->mNumChildren; ++c)
    orderJoints(node->mChildren[c], parent, bindPoses, skeleton);
}

// The file's weights follow the merged numbering: each mesh's vertices start at the offset it was appended
// at. Only meant as a reference next to a binding, so a weight naming no vertex of its mesh is dropped
// rather than failing the import.
VertexWeights gatherFileWeights(const std::vector<std::pair<const aiMesh*, std::uint32_t>>& merged,
                                const Skeleton& skeleton,
                                std::size_t numVertices) {
  std::map<std::string, std::uint32_t> jointOf;
  for (std::size_t j = 0; j < skeleton.joints.size(); ++j)
    jointOf.emplace(skeleton.joints[j].name, static_cast<std::uint32_t>(j));
  std::vector<std::vector<Influence>> rows(numVertices);
  for (const auto& [mesh, base] : merged) {
    for (unsigned b = 0; b < mesh->mNumBones; ++b) {
      const aiBone* bone = mesh->mBones[b];
      const std::uint32_t joint = jointOf.at(bone->mName.C_Str());
      for (unsigned k = 0; k < bone->mNumWeights; ++k) {
        const aiVertexWeight& w = bone->mWeights[k];
        if (w.mVertexId >= mesh->mNumVertices || !(w.mWeight > 0.0f)) continue;
        std::vector<Influence>& row = rows[base + w.mVertexId];
        // A bone listed twice in one mesh adds up rather than naming the joint twice.
        const auto same =
            std::find_if(row.begin(), row.end(), [&](const Influence& i) { return i.bone == joint; });
        if (same != row.end())
          same->weight += w.mWeight;
        else
          row.push_back({joint, w.mWeight});
      }
    }
  }
  VertexWeights weights;
  weights.offsets.reserve(numVertices + 1);
  for (std::vector<Influence>& row : rows) {
    float sum = 0.0f;
    for (const Influence& i : row) sum += i.weight;
    if (sum > 0.0f)
      for (Influence& i : row) i.weight /= sum;
    std::stable_sort(row.begin(), row.end(),
                     [](const Influence& a, const Influence& b) { return a.weight > b.weight; });
    weights.influences.insert(weights.influences.end(), row.begin(), row.end());
    weights.offsets.push_back(static_cast<std::uint32_t>(weights.influences.size()));
  }
  return weights;
}

// Exporters close a chain with an end node under its last bone ("Head_end", "Toe_End", "Bip01 L Toe0Nub"):
// not a bone, so it deforms nothing, but it is the only place the file says where that bone ends. Its
// local transform is relative to the bone's frame, so the bone's bind pose carries it into bind space.
void setLeafTips(const aiScene* scene,
                 const std::map<std::string, Mat4>& bindPoses,
                 const SurfaceMesh& mesh,
                 Skeleton& skeleton) {
  std::vector<bool> leaf(skeleton.joints.size(), true);
  for (const Joint& j : skeleton.joints)
    if (j.parent >= 0) leaf[j.parent] = false;
  // Exporters that put the end node on the joint itself say nothing about the bone's length.
  Vec3f lo = mesh.positions.front(), hi = lo;
  for (const Vec3f& p : mesh.positions)
    for (int k = 0; k < 3; ++k) lo[k] = std::min(lo[k], p[k]), hi[k] = std::max(hi[k], p[k]);
  const double coincident = 1e-6 * std::hypot(hi[0] - lo[0], hi[1] - lo[1], hi[2] - lo[2]);
  for (std::size_t j = 0; j < skeleton.joints.size(); ++j) {
    if (!leaf[j]) continue;
    Joint& joint = skeleton.joints[j];
    const aiNode* node = scene->mRootNode->FindNode(joint.name.c_str());
    if (node == nullptr) continue;
    const Vec3f at = translationOf(joint.bindPose);
    double farthest = coincident;
    for (unsigned c = 0; c < node->mNumChildren; ++c) {
      const aiNode* child = node->mChildren[c];
      // A node holding a mesh is a prop the bone carries, placed wherever its author liked.
      if (bindPoses.count(child->mName.C_Str()) > 0 || child->mNumMeshes > 0) continue;
      const Vec3f end = translationOf(multiply(joint.bindPose, toMat4(child->mTransformation)));
      const double distance = std::hypot(end[0] - at[0], end[1] - at[1], end[2] - at[2]);
      if (distance > farthest) {
        farthest = distance;
        joint.tip = end;
      }
    }
  }
}

void importSkinned(const aiScene* scene, ImportedAsset& asset) {
  // A bone's bind pose is the inverse of its offset matrix in the space of the mesh that names it. When
  // meshes were exported in different spaces, a bone they share relates the two spaces, so each later
  // mesh is carried into the space of the first one through a bone already known.
  std::map<std::string, Mat4> bindPoses;
  std::vector<std::pair<const aiMesh*, std::uint32_t>> merged;  // with the merged index of its first vertex
  for (unsigned m = 0; m < scene->mNumMeshes; ++m) {
    const aiMesh* mesh = scene->mMeshes[m];
    if (mesh->mNumBones == 0 || !hasTriangles(mesh)) {
      ++asset.meshesSkipped;
      continue;
    }
    Mat4 toBindSpace = identity();
    for (unsigned b = 0; b < mesh->mNumBones; ++b) {
      const auto known = bindPoses.find(mesh->mBones[b]->mName.C_Str());
      if (known != bindPoses.end()) {
        toBindSpace = multiply(known->second, toMat4(mesh->mBones[b]->mOffsetMatrix));
        break;
      }
    }
    for (unsigned b = 0; b < mesh->mNumBones; ++b) {
      const aiBone* bone = mesh->mBones[b];
      bindPoses.emplace(bone->mName.C_Str(), multiply(toBindSpace, inverse(toMat4(bone->mOffsetMatrix))));
    }
    merged.emplace_back(mesh, static_cast<std::uint32_t>(asset.mesh.positions.size()));
    appendMesh(mesh, toBindSpace, asset.mesh);
    ++asset.meshesMerged;
  }
  orderJoints(scene->mRootNode, -1, bindPoses, asset.skeleton);
  // A bone without a node of its name still deforms its vertices; keep it as a root.
  if (asset.skeleton.joints.size() < bindPoses.size()) {
    std::map<std::string, bool> placed;
    for (const Joint& j : asset.skeleton.joints) placed[j.name] = true;
    for (const auto& [name, pose] : bindPoses)
      if (placed.count(name) == 0) asset.skeleton.joints.push_back({name, -1, pose, {}});
  }
  if (asset.mesh.positions.empty()) return;
  asset.fileWeights = gatherFileWeights(merged, asset.skeleton, asset.mesh.positions.size());
  setLeafTips(scene, bindPoses, asset.mesh, asset.skeleton);
}

void importStatic(const aiScene* scene, ImportedAsset& asset) {
  std::vector<std::pair<unsigned, Mat4>> instances;
  collectInstances(scene->mRootNode, instances);
  std::vector<bool> used(scene->mNumMeshes, false);
  for (const auto& [index, world] : instances) {
    if (index >= scene->mNumMeshes || !hasTriangles(scene->mMeshes[index])) continue;
    appendMesh(scene->mMeshes[index], world, asset.mesh);
    used[index] = true;
    ++asset.meshesMerged;
  }
  for (bool u : used) asset.meshesSkipped += u ? 0 : 1;
}

// Importers may quote whole stretches of a broken file in their message; the user gets its first line,
// and no more than `limit` characters of it.
std::string oneLine(const std::string& text, std::size_t limit) {
  std::string line = text.substr(0, text.find_first_of("\r\n"));
  if (line.size() > limit) line = line.substr(0, limit - 3) + "...";
  return line;
}

}  // namespace

ImportedAsset importAsset(const std::string& path, bool ignoreFileSkeleton) {
  std::error_code ec;
  if (std::filesystem::is_directory(path, ec))
    throw std::runtime_error("cannot read '" + path + "': it is a directory");
  {
    std::ifstream probe(path, std::ios::binary);
    if (!probe) throw std::runtime_error("cannot read '" + path + "': " + std::strerror(errno));
  }
  Assimp::Importer importer;
  // Identical vertices are joined so that shared corners stay shared; vertices that differ in normal or
  // texture coordinate stay apart and are welded for binding only.
  const unsigned flags = aiProcess_Triangulate | aiProcess_JoinIdenticalVertices |
                         aiProcess_GenSmoothNormals | aiProcess_SortByPType;
  const aiScene* scene = importer.ReadFile(path, flags);
  if (scene == nullptr || scene->mRootNode == nullptr)
    throw std::runtime_error("cannot import '" + path + "': " + oneLine(importer.GetErrorString(), 200));

  ImportedAsset asset;
  bool skinned = false;
  for (unsigned m = 0; m < scene->mNumMeshes; ++m) skinned |= scene->mMeshes[m]->mNumBones > 0;
  if (skinned && !ignoreFileSkeleton) {
    importSkinned(scene, asset);
  } else {
    importStatic(scene, asset);
  }
  if (asset.mesh.triangles.empty()) throw std::runtime_error("'" + path + "' holds no triangles");
  return asset;
}

}  // namespace tessik::bind
