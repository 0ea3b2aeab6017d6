#include "csv_export.h"

#include <charconv>
#include <filesystem>
#include <fstream>
#include <locale>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

namespace tessik::bind {
namespace {

std::string csvField(const std::string& text) {
  if (text.find_first_of(",\"\r\n") == std::string::npos) return text;
  std::string quoted = "\"";
  for (char c : text) {
    if (c == '"') quoted += '"';
    quoted += c;
  }
  return quoted + '"';
}

void checkWeights(const Skeleton& skeleton, const VertexWeights& weights) {
  const auto& offsets = weights.offsets;
  if (offsets.empty() || offsets.front() != 0 || offsets.back() != weights.influences.size())
    throw std::invalid_argument("the weight offsets do not cover the influences");
  for (std::size_t v = 0; v + 1 < offsets.size(); ++v)
    if (offsets[v] > offsets[v + 1])
      throw std::invalid_argument("the weight offsets decrease at vertex " + std::to_string(v));
  for (const Influence& influence : weights.influences)
    if (influence.joint >= skeleton.joints.size())
      throw std::invalid_argument("an influence names joint " + std::to_string(influence.joint) + " of " +
                                  std::to_string(skeleton.joints.size()));
}

}  // namespace

void writeWeightsCsv(const std::string& path, const Skeleton& skeleton, const VertexWeights& weights) {
  checkWeights(skeleton, weights);

  std::vector<std::string> names;
  names.reserve(skeleton.joints.size());
  for (const Joint& joint : skeleton.joints) names.push_back(csvField(joint.name));

  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (!out) throw std::runtime_error("cannot open '" + path + "' for writing");
  out.imbue(std::locale::classic());  // no digit grouping in vertex numbers, whatever the global locale
  out << "vertex,bone,weight\n";
  // to_chars: shortest round-trip text, and immune to the locale's decimal comma.
  char number[32];
  for (std::size_t v = 0; v < weights.numVertices(); ++v)
    for (std::uint32_t i = weights.begin(v); i < weights.end(v); ++i) {
      const Influence& influence = weights.influences[i];
      const auto end = std::to_chars(number, number + sizeof number, influence.weight).ptr;
      out << v << ',' << names[influence.joint] << ',' << std::string_view(number, end - number) << '\n';
    }
  out.close();
  if (!out) {
    std::error_code ignored;  // a device such as /dev/full is not ours to remove
    if (std::filesystem::is_regular_file(path, ignored)) std::filesystem::remove(path, ignored);
    throw std::runtime_error("cannot write '" + path + "'");
  }
}

}  // namespace tessik::bind
