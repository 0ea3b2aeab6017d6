#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind {

ITransformHierarchy::~ITransformHierarchy() = default;

ITransformHierarchy* ITransformHierarchy::create() { return new TransformHierarchyImpl(); }

void ITransformHierarchy::dispose(ITransformHierarchy* hierarchy) { delete hierarchy; }

TransformHierarchyImpl::~TransformHierarchyImpl() = default;

std::int32_t HierarchyData::parentIndex(std::uint32_t node) const {
  const auto parent = parentNames.find(names[node]);
  if (parent == parentNames.end() || parent->second.empty()) return -1;
  const auto index = nameToIndex.find(parent->second);
  if (index == nameToIndex.end()) return -1;
  return static_cast<std::int32_t>(index->second);
}

bool TransformHierarchyImpl::addNode(const char* name, const double* matrix, const char* parentName) {
  if (name == nullptr || matrix == nullptr || name[0] == '\0') return false;
  if (data.nameToIndex.count(name) != 0) return false;
  // Row-major in, column-major stored: input element 4r + c becomes stored element 4c + r.
  Matrix4 stored;
  for (int r = 0; r < 4; ++r)
    for (int c = 0; c < 4; ++c) stored[4 * c + r] = matrix[4 * r + c];
  const auto index = static_cast<std::uint32_t>(data.transforms.size());
  data.transforms.push_back(stored);
  addedTransforms_.push_back(stored);
  data.names.emplace_back(name);
  data.nameToIndex[name] = index;
  data.parentNames[name] = parentName != nullptr ? parentName : "";
  return true;
}

void TransformHierarchyImpl::clear() {
  data.names.clear();
  data.nameToIndex.clear();
  data.transforms.clear();
  data.parentNames.clear();
  addedTransforms_.clear();
  prepared = false;
}

void TransformHierarchyImpl::restoreAdded() {
  if (!prepared) return;
  data.transforms = addedTransforms_;
  prepared = false;
}

}  // namespace TessikSDK::GeomBind
