#include "geombind/context.h"

#include <algorithm>
#include <memory>

#include <GL/glew.h>

#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"
#include "geombind/algorithm/heatmap/heatmap_bind.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/progress.h"
#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind {

namespace {

// Debian's GLEW is built for GLX. In a context made through EGL it loads every GL entry point and then
// fails only its GLX part with this code; the GL side is fully usable.
bool glewReady(GLenum status) {
#if defined(_WIN32)
  return status == GLEW_OK;
#else
  return status == GLEW_OK || status == GLEW_ERROR_NO_GLX_DISPLAY;
#endif
}

VertexWeights runStrategy(Algorithm::IBindStrategy& strategy,
                          const BindInputs& inputs,
                          const Algorithm::IBindOptions& options,
                          IProgress* progress) {
  ProgressImpl console;
  return strategy.bind(*inputs.mesh, *inputs.hierarchy, options, progress != nullptr ? *progress : console);
}

}  // namespace

BindInputs prepareBindInputs(IMesh* mesh, ITransformHierarchy* hierarchy, PreparationMode mode) {
  // Objects a host made itself rather than through the factories carry no data to bind.
  auto* meshImpl = dynamic_cast<MeshImpl*>(mesh);
  auto* hierarchyImpl = dynamic_cast<TransformHierarchyImpl*>(hierarchy);
  if (meshImpl == nullptr || hierarchyImpl == nullptr) return {};
  meshImpl->restoreAdded();
  hierarchyImpl->restoreAdded();
  if (!isBindable(meshImpl->data)) return {};
  meshImpl->prepared = hierarchyImpl->prepared = true;
  prepareForBinding(meshImpl->data, hierarchyImpl->data, mode);
  if (mode == PreparationMode::heatmap) Algorithm::computeVertexNormals(meshImpl->data);
  return {&meshImpl->data, &hierarchyImpl->data};
}

float clampFalloff(float falloff) { return std::min(1.0f, std::max(0.0f, falloff)); }

IContext::~IContext() = default;

IContext* IContext::create() {
  auto context = std::make_unique<ContextImpl>();
  if (!glewReady(glewInit())) return nullptr;
  if (!glewIsSupported("GL_VERSION_2_1")) return nullptr;
  return context.release();
}

void IContext::dispose(IContext* context) { delete context; }

ContextImpl::~ContextImpl() = default;

void ContextImpl::reserved() {}

ISparseVertexWeights* ContextImpl::bindGeodesicSparseVoxel(IMesh* mesh,
                                                           ITransformHierarchy* hierarchy,
                                                           IProgress* progress,
                                                           float falloff,
                                                           unsigned int influenceLimit,
                                                           int resolution,
                                                           bool refineInterior) {
  result.perVertex = VertexWeights();
  const BindInputs inputs = prepareBindInputs(mesh, hierarchy, PreparationMode::geodesic);
  if (inputs.mesh == nullptr) return &result;

  Algorithm::GeodesicSparseVoxelOptions options;
  options.resolution = resolution;
  options.influenceLimit = static_cast<std::int32_t>(influenceLimit);
  options.falloff = clampFalloff(falloff);
  options.refineInterior = refineInterior;
  options.lowFalloffExponent = 5.0f;
  options.highFalloffExponent = 30.0f;
  options.boundaryCostFactor = 4.0f;
  options.smoothingIterations = Algorithm::smoothingIterationsFor(resolution);

  Algorithm::GeodesicSparseVoxelBind strategy;
  result.perVertex = runStrategy(strategy, inputs, options, progress);
  return &result;
}

ISparseVertexWeights* ContextImpl::bindHeatmap(IMesh* mesh,
                                               ITransformHierarchy* hierarchy,
                                               IProgress* progress,
                                               float falloff,
                                               unsigned int influenceLimit) {
  result.perVertex = VertexWeights();
  const BindInputs inputs = prepareBindInputs(mesh, hierarchy, PreparationMode::heatmap);
  if (inputs.mesh == nullptr) return &result;

  Algorithm::HeatmapOptions options;
  options.influenceLimit = static_cast<std::int32_t>(influenceLimit);
  options.falloff = clampFalloff(falloff);

  Algorithm::HeatmapBind strategy;
  result.perVertex = runStrategy(strategy, inputs, options, progress);
  return &result;
}

}  // namespace TessikSDK::GeomBind
