#include "binding.h"

namespace tessik::bind {

namespace pl = TessikSDK::Pipeline;

const char* methodName(BindMethod method) { return method == BindMethod::geodesic ? "geodesic" : "heatmap"; }

pl::Options pipelineOptions(const BindSettings& settings) {
  pl::Options options;
  options.method = settings.method == BindMethod::geodesic ? pl::Method::geodesic : pl::Method::heatmap;
  options.resolution = settings.resolution;
  options.falloff = settings.falloff;
  options.maxInfluences = settings.maxInfluences;
  options.refineInterior = settings.refineInterior;
  options.voxelizer = settings.voxelizer;
  options.leafTips = settings.leafTips;
  options.verbose = settings.verbose;
  return options;
}

BoundAsset bindAsset(const SurfaceMesh& mesh,
                     const Skeleton& skeleton,
                     const BindSettings& settings,
                     TessikSDK::GeomBind::IProgress* progress) {
  pl::Mesh surface{mesh.positions, mesh.triangles};
  std::vector<pl::Bone> bones;
  bones.reserve(skeleton.joints.size());
  for (const Joint& j : skeleton.joints) {
    pl::Bone bone;
    bone.name = j.name;
    bone.parent = j.parent;
    bone.bindPose = j.bindPose;
    if (j.tip.has_value()) {
      bone.hasTip = true;
      bone.tip = {(*j.tip)[0], (*j.tip)[1], (*j.tip)[2]};
    }
    bones.push_back(std::move(bone));
  }
  pl::Result result = pl::bindSkin(surface, bones, pipelineOptions(settings), progress);

  return {std::move(result.weights), std::move(result.report)};
}

}  // namespace tessik::bind
