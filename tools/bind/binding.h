#pragma once

#include <string>

#include <tessik/geombind.h>

#include "asset.h"

namespace tessik::bind {

enum class BindMethod { geodesic, heatmap };

// The library's own defaults.
struct BindSettings {
  BindMethod method = BindMethod::geodesic;
  int resolution = 64;
  float falloff = 0.5f;
  unsigned maxInfluences = 4;  // 0 keeps every influence
  bool refineInterior = false;
};

const char* methodName(BindMethod method);

// Binds `mesh` to `skeleton` with the library, on the calling thread, whose OpenGL context must be
// current. Influences name skeleton joints and come sorted by decreasing weight. The result has no
// vertices when the binding failed or was cancelled. Throws std::runtime_error when the library cannot
// start on the current context.
VertexWeights bindSurface(const SurfaceMesh& mesh,
                          const Skeleton& skeleton,
                          const BindSettings& settings,
                          TessikSDK::GeomBind::IProgress* progress);

}  // namespace tessik::bind
