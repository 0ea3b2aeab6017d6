#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "asset.h"

// A picture of a bound mesh for people to judge the weights by: the surface coloured by joint, the
// skeleton drawn over it.
namespace tessik::bind {

// Who draws the picture: OpenGL in the context current on the calling thread, or the processor alone,
// which needs no context and no graphics library. Both draw the same picture, give or take a sample
// along edges and a step of rounding in colours.
enum class PreviewDevice { opengl, cpu };

struct PreviewOptions {
  int width = 800;  // pixels, 16 to 8192
  int height = 800;
  PreviewDevice device = PreviewDevice::opengl;
};

// The colour that marks joint `joint` in the preview, each channel in [0, 1]. Hues step by the golden
// ratio, so neighbouring indices (usually neighbouring bones) differ strongly; the same index always
// gets the same colour.
Vec3f jointColour(std::uint32_t joint);

// Draws the mesh seen from the front (from +Z looking toward -Z, +Y up; orthographic, framing the mesh and
// the joints with a margin, aspect kept) and returns the picture as RGBA8, top row first,
// width * height * 4 bytes. With PreviewDevice::opengl it draws into an off-screen framebuffer of the
// OpenGL context current on this thread; with PreviewDevice::cpu it draws on OpenMP threads, touches no
// GL state and needs no context.
// A vertex's colour is its joints' colours blended by weight, grey without weights, shaded from the
// mesh's normals (recomputed from the triangles when it has none) on both sides. The skeleton is drawn
// over everything: a white bar with a dark outline from each joint to its parent and a dot at each joint,
// at the translations of jointWorld (bind poses or posedJointTransforms).
// For PreviewDevice::opengl the context must be GL 2.1 or newer with framebuffer objects (GL 3.0, ARB_ or
// EXT_framebuffer_object), compatibility profile; every GL object made here is
// deleted and the state touched is restored before returning, also when this throws. Throws
// std::invalid_argument for a size outside [16, 8192] or inputs checkSkinInputs rejects, and
// (PreviewDevice::opengl) std::runtime_error when no context is current or the framebuffer cannot be made
// or read.
std::vector<std::uint8_t> renderPreviewPixels(const SurfaceMesh& mesh,
                                              const Skeleton& skeleton,
                                              const std::vector<Mat4>& jointWorld,
                                              const VertexWeights& weights,
                                              const PreviewOptions& options);

// renderPreviewPixels written as an RGB PNG at `pngPath`; additionally throws std::runtime_error when
// the file cannot be written.
void renderPreview(const std::string& pngPath,
                   const SurfaceMesh& mesh,
                   const Skeleton& skeleton,
                   const std::vector<Mat4>& jointWorld,
                   const VertexWeights& weights,
                   const PreviewOptions& options);

}  // namespace tessik::bind
