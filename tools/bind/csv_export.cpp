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

}  // namespace

void writeWeightsCsv(const std::string& path, const Skeleton& skeleton, const VertexWeights& weights) {
  const std::string fault = TessikSDK::Pipeline::checkWeights(
      weights, weights.offsets.empty() ? 0 : weights.numVertices(), skeleton.joints.size());
  if (!fault.empty()) throw std::invalid_argument(fault);

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
      out << v << ',' << names[influence.bone] << ',' << std::string_view(number, end - number) << '\n';
    }
  out.close();
  if (!out) {
    std::error_code ignored;  // a device such as /dev/full is not ours to remove
    if (std::filesystem::is_regular_file(path, ignored)) std::filesystem::remove(path, ignored);
    throw std::runtime_error("cannot write '" + path + "'");
  }
}

}  // namespace tessik::bind
