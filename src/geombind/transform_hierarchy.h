#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "tessik/geombind.h"

namespace TessikSDK::GeomBind {

/// A 4x4 transform stored column by column: elements 12, 13, 14 are the translation (joint position).
using Matrix4 = std::array<double, 16>;

/// The bones as both binding methods read them. A node's index is its position in `names`.
struct HierarchyData {
  std::vector<std::string> names;
  std::map<std::string, std::uint32_t> nameToIndex;
  std::vector<Matrix4> transforms;
  /// Node name to the parent name given when it was added; empty for none.
  std::map<std::string, std::string> parentNames;

  std::uint32_t nodeCount() const { return static_cast<std::uint32_t>(transforms.size()); }
  /// The parent's node index, or -1 for a root or a parent name that is not a node. `node` must be
  /// below nodeCount().
  std::int32_t parentIndex(std::uint32_t node) const;
};

class TransformHierarchyImpl : public ITransformHierarchy {
 public:
  bool addNode(const char* name, const double* matrix, const char* parentName) override;
  void clear() override;
  ~TransformHierarchyImpl() override;

  /// Puts back the transforms the host added, when a binding has reduced them to joint positions in
  /// its unit frame since (see MeshImpl::restoreAdded).
  void restoreAdded();

  HierarchyData data;
  /// Set by a binding once it has prepared `data`.
  bool prepared = false;

 private:
  std::vector<Matrix4> addedTransforms_;
};

}  // namespace TessikSDK::GeomBind
