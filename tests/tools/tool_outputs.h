#pragma once

#include <array>
#include <cstdint>
#include <cstring>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <stb_image.h>
#include <tiny_gltf.h>

#include "asset.h"

// Reads back what the binding tool writes, the way a viewer would, independently of the writers' own code.
namespace tessik::test {

// Empty model and a message in `error` when the file does not load.
inline tinygltf::Model loadGltf(const std::string& path, std::string* error) {
  tinygltf::Model model;
  tinygltf::TinyGLTF loader;
  std::string warning;
  const bool binary = path.size() > 4 && path.compare(path.size() - 4, 4, ".glb") == 0;
  const bool ok = binary ? loader.LoadBinaryFromFile(&model, error, &warning, path)
                         : loader.LoadASCIIFromFile(&model, error, &warning, path);
  return ok ? model : tinygltf::Model();
}

// Every component of every element, read through the accessor's view; empty when it reads past the view.
inline std::vector<double> readAccessor(const tinygltf::Model& model, int index) {
  const tinygltf::Accessor& accessor = model.accessors.at(static_cast<std::size_t>(index));
  const tinygltf::BufferView& view = model.bufferViews.at(static_cast<std::size_t>(accessor.bufferView));
  const auto& data = model.buffers.at(static_cast<std::size_t>(view.buffer)).data;
  const int components = tinygltf::GetNumComponentsInType(static_cast<std::uint32_t>(accessor.type));
  const auto size = static_cast<std::size_t>(tinygltf::GetComponentSizeInBytes(accessor.componentType));
  const std::size_t stride = view.byteStride != 0 ? view.byteStride : components * size;
  std::vector<double> out;
  for (std::size_t e = 0; e < accessor.count; ++e)
    for (int c = 0; c < components; ++c) {
      const std::size_t at = accessor.byteOffset + e * stride + c * size;
      if (at + size > view.byteLength || view.byteOffset + at + size > data.size()) return {};
      std::uint32_t bits = 0;
      std::memcpy(&bits, data.data() + view.byteOffset + at, size);
      float f;
      std::memcpy(&f, &bits, 4);
      out.push_back(accessor.componentType == TINYGLTF_COMPONENT_TYPE_FLOAT ? f : bits);
    }
  return out;
}

// A node's parent, or -1.
inline int parentNode(const tinygltf::Model& model, int node) {
  for (std::size_t p = 0; p < model.nodes.size(); ++p)
    for (int child : model.nodes[p].children)
      if (child == node) return static_cast<int>(p);
  return -1;
}

// glTF stores matrices column by column.
inline bind::Mat4 columnMajor(const std::vector<double>& v, std::size_t first = 0) {
  bind::Mat4 m{};
  for (int r = 0; r < 4; ++r)
    for (int c = 0; c < 4; ++c) m[4 * r + c] = v.at(first + 4 * c + r);
  return m;
}

inline bind::Mat4 nodeWorld(const tinygltf::Model& model, int node) {
  const tinygltf::Node& n = model.nodes.at(static_cast<std::size_t>(node));
  bind::Mat4 local = bind::identity();
  if (n.matrix.size() == 16) {
    local = columnMajor(n.matrix);
  } else {
    const std::vector<double> q = n.rotation.empty() ? std::vector<double>{0, 0, 0, 1} : n.rotation;
    const double x = q[0], y = q[1], z = q[2], w = q[3];
    const std::vector<double> s = n.scale.empty() ? std::vector<double>{1, 1, 1} : n.scale;
    const std::vector<double> t = n.translation.empty() ? std::vector<double>{0, 0, 0} : n.translation;
    const double r[3][3] = {{1 - 2 * (y * y + z * z), 2 * (x * y - z * w), 2 * (x * z + y * w)},
                            {2 * (x * y + z * w), 1 - 2 * (x * x + z * z), 2 * (y * z - x * w)},
                            {2 * (x * z - y * w), 2 * (y * z + x * w), 1 - 2 * (x * x + y * y)}};
    for (int i = 0; i < 3; ++i) {
      for (int j = 0; j < 3; ++j) local[4 * i + j] = r[i][j] * s[j];
      local[4 * i + 3] = t[i];
    }
  }
  const int parent = parentNode(model, node);
  return parent < 0 ? local : bind::multiply(nodeWorld(model, parent), local);
}

// What a viewer needs of a skinned file.
struct SkinnedGltf {
  std::string error;  // empty when the file loaded with one mesh and one skin
  std::size_t vertices = 0;
  std::vector<std::array<float, 3>> positions;
  std::vector<std::string> jointNames;
  // Per vertex: joint indices and weights over every JOINTS_n/WEIGHTS_n set, zero weights left out.
  std::vector<std::vector<std::pair<std::uint32_t, float>>> influences;
};

inline SkinnedGltf readSkinnedGltf(const std::string& path) {
  SkinnedGltf r;
  const tinygltf::Model m = loadGltf(path, &r.error);
  if (!r.error.empty()) return r;
  if (m.meshes.size() != 1 || m.meshes[0].primitives.size() != 1 || m.skins.size() != 1) {
    r.error = "expected one mesh and one skin";
    return r;
  }
  const auto& attributes = m.meshes[0].primitives[0].attributes;
  const auto read = [&](const std::string& name) {
    const auto it = attributes.find(name);
    return it == attributes.end() ? std::vector<double>() : readAccessor(m, it->second);
  };
  const std::vector<double> positions = read("POSITION");
  r.vertices = positions.size() / 3;
  for (std::size_t v = 0; v < r.vertices; ++v)
    r.positions.push_back(
        {float(positions[3 * v]), float(positions[3 * v + 1]), float(positions[3 * v + 2])});
  for (int node : m.skins[0].joints) r.jointNames.push_back(m.nodes.at(static_cast<std::size_t>(node)).name);
  r.influences.resize(r.vertices);
  for (int set = 0;; ++set) {
    const std::vector<double> joints = read("JOINTS_" + std::to_string(set));
    const std::vector<double> weights = read("WEIGHTS_" + std::to_string(set));
    if (joints.empty() || weights.size() != 4 * r.vertices || joints.size() != weights.size()) break;
    for (std::size_t i = 0; i < weights.size(); ++i)
      if (weights[i] != 0.0) r.influences[i / 4].emplace_back(std::uint32_t(joints[i]), float(weights[i]));
  }
  return r;
}

// Every vertex's weights sum to 1 and name one of `joints` joints.
inline void expectConsistentSkin(const std::string& path, std::size_t joints) {
  const SkinnedGltf g = readSkinnedGltf(path);
  ASSERT_TRUE(g.error.empty()) << path << ": " << g.error;
  EXPECT_EQ(g.jointNames.size(), joints);
  ASSERT_GT(g.vertices, 0u);
  for (std::size_t v = 0; v < g.vertices; ++v) {
    float sum = 0.0f;
    for (const auto& [joint, weight] : g.influences[v]) {
      ASSERT_LT(joint, joints);
      sum += weight;
    }
    ASSERT_NEAR(sum, 1.0f, 1e-5f) << path << " vertex " << v;
  }
}

struct Picture {
  int width = 0;
  int height = 0;
  std::vector<unsigned char> rgb;  // empty when the file does not load

  std::size_t distinctColours() const {
    std::set<std::uint32_t> colours;
    for (std::size_t i = 0; i + 2 < rgb.size(); i += 3)
      colours.insert(rgb[i] << 16 | rgb[i + 1] << 8 | rgb[i + 2]);
    return colours.size();
  }
};

inline Picture loadPng(const std::string& path) {
  Picture p;
  int channels = 0;
  unsigned char* data = stbi_load(path.c_str(), &p.width, &p.height, &channels, 3);
  if (data == nullptr) return p;
  p.rgb.assign(data, data + static_cast<std::size_t>(p.width) * p.height * 3);
  stbi_image_free(data);
  return p;
}

}  // namespace tessik::test
