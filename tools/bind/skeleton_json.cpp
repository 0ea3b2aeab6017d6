#include "skeleton_json.h"

#include <cerrno>
#include <cmath>
#include <cstring>
#include <fstream>
#include <map>
#include <sstream>
#include <stdexcept>
#include <vector>

#include <nlohmann/json.hpp>

namespace tessik::bind {
namespace {

struct RawBone {
  std::string name;
  std::string parent;
  Mat4 frame{};
  std::optional<Vec3f> tip;
};

[[noreturn]] void fail(const std::string& source, const std::string& what) {
  throw std::runtime_error("skeleton '" + source + "': " + what);
}

std::vector<double> numbers(const nlohmann::json& value,
                            std::size_t count,
                            const std::string& source,
                            const std::string& what) {
  if (!value.is_array() || value.size() != count)
    fail(source, what + " needs " + std::to_string(count) + " numbers");
  std::vector<double> out;
  for (const auto& v : value) {
    if (!v.is_number() || !std::isfinite(v.get<double>()))
      fail(source, what + " needs " + std::to_string(count) + " finite numbers");
    out.push_back(v.get<double>());
  }
  return out;
}

RawBone readBone(const nlohmann::json& entry, std::size_t index, const std::string& source) {
  const std::string where = "bone " + std::to_string(index);
  if (!entry.is_object()) fail(source, where + " is not an object");
  RawBone bone;
  const auto name = entry.find("name");
  if (name == entry.end() || !name->is_string() || name->get<std::string>().empty())
    fail(source, where + " has no name");
  bone.name = name->get<std::string>();
  const std::string label = "bone '" + bone.name + "'";
  const auto parent = entry.find("parent");
  if (parent != entry.end() && !parent->is_null()) {
    if (!parent->is_string()) fail(source, label + ": parent must be a name or null");
    bone.parent = parent->get<std::string>();
  }
  const auto matrix = entry.find("matrix");
  const auto position = entry.find("position");
  if (matrix != entry.end()) {
    const std::vector<double> m = numbers(*matrix, 16, source, label + ": matrix");
    std::copy(m.begin(), m.end(), bone.frame.begin());
  } else if (position != entry.end()) {
    const std::vector<double> p = numbers(*position, 3, source, label + ": position");
    bone.frame = identity();
    bone.frame[3] = p[0];
    bone.frame[7] = p[1];
    bone.frame[11] = p[2];
  } else {
    fail(source, label + " has neither matrix nor position");
  }
  const auto tip = entry.find("tip");
  if (tip != entry.end()) {
    const std::vector<double> t = numbers(*tip, 3, source, label + ": tip");
    bone.tip = Vec3f{static_cast<float>(t[0]), static_cast<float>(t[1]), static_cast<float>(t[2])};
  }
  return bone;
}

}  // namespace

Skeleton parseSkeletonJson(const std::string& text, const std::string& source) {
  nlohmann::json doc;
  try {
    doc = nlohmann::json::parse(text);
  } catch (const nlohmann::json::parse_error& e) {
    fail(source, std::string("not valid JSON (") + e.what() + ")");
  }
  if (!doc.is_array()) fail(source, "expected a list of bones");
  if (doc.empty()) fail(source, "lists no bones");

  std::vector<RawBone> raw;
  std::map<std::string, std::size_t> byName;
  for (std::size_t i = 0; i < doc.size(); ++i) {
    raw.push_back(readBone(doc[i], i, source));
    if (!byName.emplace(raw.back().name, i).second)
      fail(source, "bone '" + raw.back().name + "' appears twice");
  }
  std::vector<int> parentOf(raw.size(), -1);
  for (std::size_t i = 0; i < raw.size(); ++i) {
    if (raw[i].parent.empty()) continue;
    const auto it = byName.find(raw[i].parent);
    if (it == byName.end())
      fail(source, "bone '" + raw[i].name + "' names unknown parent '" + raw[i].parent + "'");
    parentOf[i] = static_cast<int>(it->second);
  }

  // Emit each bone once its parent is out, sweeping in file order; a sweep that places nothing while
  // bones remain means the rest hang off a loop.
  Skeleton skeleton;
  std::vector<int> placedAs(raw.size(), -1);
  std::size_t placed = 0;
  while (placed < raw.size()) {
    std::size_t before = placed;
    for (std::size_t i = 0; i < raw.size(); ++i) {
      if (placedAs[i] >= 0) continue;
      const int p = parentOf[i];
      if (p >= 0 && placedAs[p] < 0) continue;
      placedAs[i] = static_cast<int>(skeleton.joints.size());
      skeleton.joints.push_back({raw[i].name, p >= 0 ? placedAs[p] : -1, raw[i].frame, raw[i].tip});
      ++placed;
    }
    if (placed == before) {
      for (std::size_t i = 0; i < raw.size(); ++i)
        if (placedAs[i] < 0) fail(source, "the parents of bone '" + raw[i].name + "' form a loop");
    }
  }
  return skeleton;
}

Skeleton readSkeletonJson(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  if (!in) throw std::runtime_error("cannot read skeleton '" + path + "': " + std::strerror(errno));
  std::ostringstream text;
  text << in.rdbuf();
  return parseSkeletonJson(text.str(), path);
}

}  // namespace tessik::bind
