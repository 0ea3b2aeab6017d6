#pragma once

#include <string>

#include <tessik/geombind.h>
#include <tessik/pipeline.h>

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
  // Where the geodesic method voxelises the inside; also whether the preview may draw through OpenGL.
  TessikSDK::Pipeline::Voxelizer voxelizer = TessikSDK::Pipeline::Voxelizer::automatic;
  bool leafTips = true;
  bool verbose = false;  // let the library print its own phase lines and stage table
};

const char* methodName(BindMethod method);
TessikSDK::Pipeline::Options pipelineOptions(const BindSettings& settings);

struct BoundAsset {
  VertexWeights weights;  // one row per vertex of the mesh given, influences naming skeleton joints
  TessikSDK::Pipeline::Report report;
};

// Binds `mesh` to `skeleton` through the library's binding pipeline, on the calling thread (the GPU
// voxelizer uses the OpenGL context current there). Throws TessikSDK::Pipeline::BindError when no weights
// come back.
BoundAsset bindAsset(const SurfaceMesh& mesh,
                     const Skeleton& skeleton,
                     const BindSettings& settings,
                     TessikSDK::GeomBind::IProgress* progress);

}  // namespace tessik::bind
