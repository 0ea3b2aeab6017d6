#include "binding.h"

#include <algorithm>
#include <memory>
#include <stdexcept>

namespace tessik::bind {
namespace {

namespace gb = TessikSDK::GeomBind;

template <typename T>
struct Disposer {
  void operator()(T* p) const { T::dispose(p); }
};
template <typename T>
using Owned = std::unique_ptr<T, Disposer<T>>;

}  // namespace

const char* methodName(BindMethod method) { return method == BindMethod::geodesic ? "geodesic" : "heatmap"; }

VertexWeights bindSurface(const SurfaceMesh& mesh,
                          const Skeleton& skeleton,
                          const BindSettings& settings,
                          gb::IProgress* progress) {
  const Owned<gb::IContext> context(gb::IContext::create());
  if (!context)
    throw std::runtime_error("the binding library needs a current OpenGL 2.1 context and found none");
  const Owned<gb::IMesh> target(gb::IMesh::create());
  const Owned<gb::ITransformHierarchy> hierarchy(gb::ITransformHierarchy::create());
  for (const Vec3f& p : mesh.positions) target->addVertex(p[0], p[1], p[2]);
  for (const auto& t : mesh.triangles) target->addTriangle(t[0], t[1], t[2]);
  for (const Joint& j : skeleton.joints) {
    const char* parent =
        j.parent >= 0 ? skeleton.joints[static_cast<std::size_t>(j.parent)].name.c_str() : nullptr;
    if (!hierarchy->addNode(j.name.c_str(), j.bindPose.data(), parent))
      throw std::runtime_error("bone '" + j.name + "' could not be added to the binding");
  }

  gb::ISparseVertexWeights* result =
      settings.method == BindMethod::geodesic
          ? context->bindGeodesicSparseVoxel(target.get(), hierarchy.get(), progress, settings.falloff,
                                             settings.maxInfluences, settings.resolution,
                                             settings.refineInterior)
          : context->bindHeatmap(target.get(), hierarchy.get(), progress, settings.falloff,
                                 settings.maxInfluences);

  VertexWeights weights;
  if (result->numVertices() != mesh.positions.size()) return weights;
  weights.offsets.reserve(mesh.positions.size() + 1);
  for (unsigned v = 0; v < mesh.positions.size(); ++v) {
    const auto first = weights.influences.size();
    for (unsigned i = 0; i < result->numWeights(v); ++i) {
      const gb::BoneWeight w = result->getWeight(v, i);
      if (w.weight > 0.0 && w.boneIndex < skeleton.joints.size())
        weights.influences.push_back({w.boneIndex, static_cast<float>(w.weight)});
    }
    std::stable_sort(weights.influences.begin() + static_cast<std::ptrdiff_t>(first),
                     weights.influences.end(),
                     [](const Influence& a, const Influence& b) { return a.weight > b.weight; });
    weights.offsets.push_back(static_cast<std::uint32_t>(weights.influences.size()));
  }
  return weights;
}

}  // namespace tessik::bind
