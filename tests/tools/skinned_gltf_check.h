#pragma once

#include <array>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <tiny_gltf.h>

namespace tessik::test {

// What a viewer needs of a skinned glTF file, read back independently of the writer's own structures.
struct SkinnedGltf {
  std::string error;  // empty when the file loaded and every check below could be made
  std::size_t vertices = 0;
  std::size_t triangles = 0;
  std::vector<std::array<float, 3>> positions;
  std::vector<std::string> jointNames;
  std::size_t weightSets = 0;
  // Per vertex: joint indices and weights over every JOINTS_n/WEIGHTS_n set, zero weights left out.
  std::vector<std::vector<std::pair<std::uint32_t, float>>> influences;
};

namespace detail {

// Element `i` of an accessor, component `c`, as a double.
inline double component(const tinygltf::Model& m, const tinygltf::Accessor& a, std::size_t i, int c) {
  const tinygltf::BufferView& view = m.bufferViews[static_cast<std::size_t>(a.bufferView)];
  const int size = tinygltf::GetComponentSizeInBytes(static_cast<std::uint32_t>(a.componentType));
  const int count = tinygltf::GetNumComponentsInType(static_cast<std::uint32_t>(a.type));
  const std::size_t stride = view.byteStride != 0 ? view.byteStride : static_cast<std::size_t>(size * count);
  const unsigned char* p = m.buffers[static_cast<std::size_t>(view.buffer)].data.data() + view.byteOffset +
                           a.byteOffset + i * stride + c * size;
  switch (a.componentType) {
    case TINYGLTF_COMPONENT_TYPE_FLOAT: {
      float f;
      std::memcpy(&f, p, 4);
      return f;
    }
    case TINYGLTF_COMPONENT_TYPE_UNSIGNED_BYTE:
      return *p;
    case TINYGLTF_COMPONENT_TYPE_UNSIGNED_SHORT: {
      std::uint16_t s;
      std::memcpy(&s, p, 2);
      return s;
    }
    case TINYGLTF_COMPONENT_TYPE_UNSIGNED_INT: {
      std::uint32_t u;
      std::memcpy(&u, p, 4);
      return u;
    }
    default:
      return std::nan("");
  }
}

}  // namespace detail

inline SkinnedGltf readSkinnedGltf(const std::string& path) {
  SkinnedGltf r;
  const auto fail = [](const std::string& why) {
    SkinnedGltf failed;
    failed.error = why;
    return failed;
  };
  tinygltf::Model m;
  tinygltf::TinyGLTF loader;
  std::string err, warn;
  const bool binary = path.size() > 4 && path.compare(path.size() - 4, 4, ".glb") == 0;
  const bool ok = binary ? loader.LoadBinaryFromFile(&m, &err, &warn, path)
                         : loader.LoadASCIIFromFile(&m, &err, &warn, path);
  if (!ok) return fail("load failed: " + err);
  if (m.meshes.size() != 1 || m.meshes[0].primitives.size() != 1 || m.skins.size() != 1)
    return fail("expected one mesh and one skin");
  const tinygltf::Primitive& prim = m.meshes[0].primitives[0];
  const auto attribute = [&](const std::string& name) -> const tinygltf::Accessor* {
    const auto it = prim.attributes.find(name);
    return it == prim.attributes.end() ? nullptr : &m.accessors[static_cast<std::size_t>(it->second)];
  };
  const tinygltf::Accessor* position = attribute("POSITION");
  if (position == nullptr || prim.indices < 0) return fail("no positions or indices");
  r.vertices = position->count;
  for (std::size_t v = 0; v < r.vertices; ++v)
    r.positions.push_back({static_cast<float>(detail::component(m, *position, v, 0)),
                           static_cast<float>(detail::component(m, *position, v, 1)),
                           static_cast<float>(detail::component(m, *position, v, 2))});
  r.triangles = m.accessors[static_cast<std::size_t>(prim.indices)].count / 3;
  for (int node : m.skins[0].joints) r.jointNames.push_back(m.nodes[static_cast<std::size_t>(node)].name);
  r.influences.resize(r.vertices);
  for (;; ++r.weightSets) {
    const std::string n = std::to_string(r.weightSets);
    const tinygltf::Accessor* joints = attribute("JOINTS_" + n);
    const tinygltf::Accessor* weights = attribute("WEIGHTS_" + n);
    if (joints == nullptr || weights == nullptr) break;
    if (joints->count != r.vertices || weights->count != r.vertices) return fail("attribute counts differ");
    for (std::size_t v = 0; v < r.vertices; ++v)
      for (int c = 0; c < 4; ++c) {
        const double w = detail::component(m, *weights, v, c);
        if (w != 0.0)
          r.influences[v].emplace_back(static_cast<std::uint32_t>(detail::component(m, *joints, v, c)),
                                       static_cast<float>(w));
      }
  }
  return r;
}

}  // namespace tessik::test
