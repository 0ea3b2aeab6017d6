#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <tessik/export.h>
#include <tessik/geombind.h>

/// Binding a real asset in one call: the steps every host needs between its file or arrays and the
/// binding methods of TessikSDK::GeomBind, so that the tool, the Python module and any C++ host bind
/// the same input to the same weights.
///
/// A call checks the input, welds vertices split along seams, turns pieces wound inside out (for the
/// binding only), adds a tip under every leaf bone so that a head or a hand moves as a whole, binds
/// (piece by piece when the whole surface cannot be bound at once), gives vertices no bone reached the
/// weights of their nearest neighbour or joint, folds the tips back into their leaves, and limits and
/// normalises the influences. The answer is indexed by the caller's own vertices and bones.
///
/// No method needs OpenGL unless asked to: the heat method never uses it, and the geodesic method
/// voxelises the mesh's inside on the processor unless Options::voxelizer picks the GPU. The GPU path
/// uses the OpenGL 2.1 context current on the calling thread; the pipeline makes none itself.
namespace TessikSDK::Pipeline {

/// Row by row, applied to column vectors (p' = M p): translation in elements 3, 7 and 11.
using Matrix4x4 = std::array<double, 16>;

struct Bone {
  std::string name;             ///< non-empty and unique
  int parent = -1;              ///< index into the bone list, -1 for a root; any order
  Matrix4x4 bindPose{};         ///< the joint's frame in mesh space; its translation is the joint
  bool hasTip = false;          ///< the skeleton itself says where this bone ends
  std::array<double, 3> tip{};  ///< that end, in mesh space; used only for a leaf bone
};

struct Mesh {
  std::vector<std::array<float, 3>> positions;
  std::vector<std::array<std::uint32_t, 3>> triangles;
};

enum class Method { geodesic, heatmap };

/// Where the geodesic method voxelises the inside of the mesh. `automatic` takes the GPU when a
/// hardware-accelerated OpenGL 2.1 context is current on the calling thread, and the processor when
/// there is none or it renders in software (where the processor is far faster); it loads no GL library
/// the process does not already have. `gpu` needs such a context (any renderer). Both decide the same
/// voxels but for ties within half a voxel of the surface.
enum class Voxelizer { automatic, gpu, cpu };

/// The accepted ranges, shared by every front end.
struct Limits {
  static constexpr int minResolution = 8;
  static constexpr int maxResolution = 1024;  ///< the largest grid the geodesic smoothing is tuned for
  static constexpr unsigned maxInfluences = 64;
};

struct Options {
  Method method = Method::geodesic;
  int resolution = 64;                         ///< voxels along the longest side (geodesic)
  float falloff = 0.5f;                        ///< 0 soft to 1 sharp
  unsigned maxInfluences = 4;                  ///< 0 keeps every influence
  bool refineInterior = false;                 ///< geodesic: voxelise the inside at full resolution too
  Voxelizer voxelizer = Voxelizer::automatic;  ///< geodesic: where the inside is voxelised
  /// Give every leaf bone a virtual end so that it can own the part it carries, rather than tie with
  /// its parent at its joint. The tip is the skeleton's own (Bone::hasTip) where it has one, otherwise
  /// cast from the leaf joint away from its parent to just inside the surface. Tips never appear in
  /// the result: their weights go to their leaf.
  bool leafTips = true;
  /// Let the library print its stage table and phase lines to standard output during this call. Off, a
  /// binding says nothing on the console; the process-wide GeomBind::setConsoleReports switch is set
  /// for the call and put back after it.
  bool verbose = false;
};

/// The first fault of `options` as one line naming the option, or an empty string.
TESSIK_API std::string validateOptions(const Options& options);

struct Influence {
  std::uint32_t bone = 0;  ///< index into the caller's bone list
  double weight = 0.0;
};

/// Compressed rows: the influences of vertex v are influences[offsets[v]] .. influences[offsets[v + 1] - 1],
/// strongest first, summing to 1.
struct Weights {
  std::vector<std::uint32_t> offsets{0};
  std::vector<Influence> influences;

  std::size_t numVertices() const { return offsets.size() - 1; }
  std::uint32_t begin(std::size_t v) const { return offsets[v]; }
  std::uint32_t end(std::size_t v) const { return offsets[v + 1]; }
};

/// What a run did, for a host's summary.
struct Report {
  std::size_t weldedVertices = 0;
  std::size_t pieces = 0;
  std::size_t turnedPieces = 0;  ///< wound inside out, turned for binding
  /// Triangles of (next to) no area left out of the binding: they add nothing to the surface, and the
  /// heat method cannot bind a surface holding one.
  std::size_t droppedTriangles = 0;
  bool boundByPiece = false;      ///< the whole surface failed, so its pieces were bound in groups
  bool interiorOnGpu = false;     ///< the geodesic method voxelised the inside on the GPU
  std::size_t unboundPieces = 0;  ///< pieces no group binding reached
  /// Of those, the ones with bones inside them, given wholly to those bones; the rest took the weights
  /// of the nearest bound vertex.
  std::size_t piecesGivenEnclosedBones = 0;
  std::size_t orphanVertices = 0;  ///< vertices no binding reached, given their nearest joint
  std::size_t tipsFromSkeleton = 0;
  std::size_t tipsCast = 0;
  std::size_t leavesWithoutTip = 0;  ///< leaf joint outside the surface, or nowhere to cast to
  std::size_t maxInfluences = 0;     ///< most influences on one vertex in the result
  double meanInfluences = 0.0;
  /// Every phase the binding announced (plus the pipeline's own), with its wall time in seconds.
  std::vector<std::pair<std::string, double>> phases;
};

struct Result {
  Weights weights;  ///< one row per caller vertex
  Report report;
};

/// The first fault of `weights` as rows for `vertexCount` vertices over `boneCount` bones, as one line,
/// or an empty string: offsets that start at 0, never decrease and end at the influence count, one row
/// per vertex, bones in range, finite non-negative weights; with `everyVertexWeighted`, a positive weight
/// in every row too. Hosts check weights they were handed with it before indexing bones by them.
TESSIK_API std::string checkWeights(const Weights& weights,
                                    std::size_t vertexCount,
                                    std::size_t boneCount,
                                    bool everyVertexWeighted = false);

/// Why a run gave no weights.
class TESSIK_API BindError : public std::runtime_error {
 public:
  enum class Kind {
    invalidInput,  ///< the mesh, bones or options are unusable; the message says which and why
    noOpenGL,      ///< the GPU voxelizer was asked for, and no OpenGL 2.1 context is current
    noWeights,     ///< the method reached no bone from any piece of the surface
    cancelled,     ///< the progress object asked to stop
  };
  BindError(Kind kind, const std::string& message);
  ~BindError() override;
  Kind kind() const { return kind_; }

 private:
  Kind kind_;
};

/// Binds `mesh` to `bones`. `progress` may be null; when given it sees every phase and may cancel.
/// Throws BindError (and std::bad_alloc); the mesh and bones are only read.
TESSIK_API Result bindSkin(const Mesh& mesh,
                           const std::vector<Bone>& bones,
                           const Options& options,
                           GeomBind::IProgress* progress = nullptr);

using GeomBind::NullProgress;

/// Progress and cancellation as plain callables, for hosts that would rather not implement
/// GeomBind::IProgress. Either may be empty. Both may be called from the binding's worker threads, so
/// they must be thread-safe.
struct Callbacks {
  /// A phase's name (as the library titles it) and how far it is, from 0 when it begins to 1 when it ends.
  std::function<void(const std::string& phase, double fraction)> progress;
  /// True to stop the run, which then throws BindError::Kind::cancelled.
  std::function<bool()> cancelled;
};

/// As above, reporting through `callbacks`.
TESSIK_API Result bindSkin(const Mesh& mesh,
                           const std::vector<Bone>& bones,
                           const Options& options,
                           const Callbacks& callbacks);

}  // namespace TessikSDK::Pipeline
