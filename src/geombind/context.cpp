#include "geombind/context.h"

#include <algorithm>
#include <memory>

#include <dlfcn.h>

#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"
#include "geombind/algorithm/heatmap/heatmap_bind.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/progress.h"
#include "geombind/transform_hierarchy.h"
#include "gl/gl_api.h"

namespace TessikSDK::GeomBind {

namespace {

// Hosts that use GLEW have always found it initialised by the context's creation; keep that when GLEW
// is in the process, without ever loading it ourselves.
void initialiseHostGlew() {
  for (const char* name : {"libGLEW.so.2.2", "libGLEW.so.2.1", "libGLEW.so"}) {
    void* glew = dlopen(name, RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD);
    if (glew == nullptr) continue;
    using Init = GLenum (*)();
    if (auto init = reinterpret_cast<Init>(dlsym(glew, "glewInit"))) init();
    dlclose(glew);  // only drops the reference RTLD_NOLOAD took
    return;
  }
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
  // Without a current context the version string is null, so this also refuses a thread with none.
  if (!GL::load() || !GL::versionAtLeast(2, 1)) return nullptr;
  initialiseHostGlew();
  return context.release();
}

IContext* IContext::createWithoutOpenGL() { return new ContextImpl(Algorithm::InteriorVoxelizer::cpu); }

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
  options.voxelizer = voxelizer;

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
