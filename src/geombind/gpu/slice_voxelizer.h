#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "tessik/geombind.h"

#include "geombind/collision/primitives.h"
#include "geombind/gpu/gl_resources.h"
#include "geombind/mesh.h"
#include "geombind/voxel_bit_grid.h"
#include "geombind/voxel_votes.h"

namespace TessikSDK::GeomBind::Gpu {

/// Sets the bit of every voxel of `grid` whose cell lies inside the closed mesh; bits already set stay.
/// The grid spans mesh.boundingBox. Renders on the GPU through the OpenGL context current on this thread
/// (version 2.1): six sweeps of orthographic slices, two axis votes out of three make
/// a voxel inside. With `refineInterior`, voxels with exactly one vote are inside when the winding number
/// at their centre exceeds `windingThreshold`. An empty mesh returns without touching GL; a shader that
/// fails to build is reported on std::cerr and leaves the grid as it was.
void voxelizeInterior(IProgress& progress,
                      const MeshData& mesh,
                      VoxelBitGrid& grid,
                      bool refineInterior,
                      float windingThreshold);

/// The GLSL of the two programs; builtinShaders() is what the library ships.
struct ShaderSources {
  const char* vsSlicer;
  const char* vsAccumulator;
  const char* fsSlicer;
  const char* fsAccumulator;
};
ShaderSources builtinShaders();

/// Where castAxisVotes spends its time, when asked (benchmarks): the rendering of the slices, and the
/// readbacks with their unpacking.
struct SweepTimings {
  double renderSeconds = 0.0;
  double readbackSeconds = 0.0;
};

/// Runs the six GPU sweeps over `votes.dims` cells of mesh.boundingBox and ORs each sweep's flag into
/// the voxels it finds inside. False, with `votes` untouched and the problems on std::cerr, when the
/// programs cannot be built. Leaves the GL state as voxelizeInterior documents.
bool castAxisVotes(const MeshData& mesh,
                   AxisVoteGrid& votes,
                   const ShaderSources& shaders = builtinShaders(),
                   SweepTimings* timings = nullptr);

/// Where texel (u, v) of slice s of one sweep lands: origin + u uDir + v vDir + s sliceDir, in u32
/// arithmetic (a -1 component wraps and still adds correctly).
struct SweepMapping {
  std::array<std::uint32_t, 3> origin, uDir, vDir, sliceDir;
  std::uint8_t flag;
};

/// The mapping of axis 0, 1 or 2 (x, y, z) swept descending or ascending over a grid of `dims`.
SweepMapping sweepMapping(int axis, bool ascending, const std::array<std::uint32_t, 3>& dims);

/// Channel and increment that record accumulated slice k as bit k of the texel's 32-bit value
/// R + 256 G + 65536 B + 16777216 A: channel (k mod 32) div 8, increment 2^(k mod 8) / 255.
struct AccumulatorBit {
  std::int32_t component;
  float bitValue;
};
AccumulatorBit accumulatorBit(std::uint32_t k);

/// The mesh uploaded once for all sweeps, centred on the grid box.
struct MeshBuffers {
  GLuint vertexBuffer = 0;
  GLuint indexBuffer = 0;
  std::uint32_t indexCount = 0;
  Collision::AABB bounds;  ///< of the centred vertex positions
};

/// The GL state of one voxelization run: render targets sized for the current axis, two accumulator
/// textures that ping-pong so a pass never reads what it writes, and up to 32 slices between readbacks.
class SliceVoxelizer {
 public:
  /// Compiles and links the two programs; false (reported on std::cerr) when any of the six fails.
  bool createPrograms(const ShaderSources& shaders);
  /// Makes the targets width x height unless they already are.
  void resizeTargets(std::uint32_t width, std::uint32_t height);
  /// Clears the current accumulator and forgets pending slices.
  void clearAccumulator();
  /// Draws slice `s` (view and projection column-major) and folds it into the accumulators as bit
  /// pendingSlices.
  void renderSlice(std::uint32_t s, const float* view, const float* projection, const MeshBuffers& mesh);
  /// Reads the accumulator back once and ORs the mapping's flag into every voxel whose bit is set.
  void flushSlices(const SweepMapping& mapping, AxisVoteGrid& votes);
  /// Both sweeps of one axis (0, 1, 2) through the centred grid box.
  void sliceAxis(int axis, const Collision::AABB& centredBox, const MeshBuffers& mesh, AxisVoteGrid& votes);

  FrameBuffer framebuffer;
  Texture2D textures[3];  ///< 0, 1: accumulators (RGBA8); 2: the slice (R8)
  RenderBuffer depth;
  std::uint32_t currentAccumulator = 0;
  ShaderLibrary library;
  std::vector<std::uint8_t> readbackBuffer;
  std::uint32_t pendingSlices = 0;
  std::uint32_t sliceIndices[32] = {};
  /// When set, readbacks first wait for the GPU (glFinish) so render and readback times separate.
  SweepTimings* timings = nullptr;
};

}  // namespace TessikSDK::GeomBind::Gpu
