#pragma once

#include <cstddef>
#include <cstdint>

#include <tessik/export.h>

/// Automatic skin binding: a triangle mesh and a bone hierarchy in, per-vertex (bone, weight) lists out.
///
/// Every object is made by a static `create` and released by the matching `dispose`; never `delete`
/// them. Binding never throws except std::bad_alloc: failures show as a null context or an empty
/// result. A context, mesh or hierarchy must be used by one thread at a time, and two geodesic bindings
/// must not run at the same time in one process (they share the stage timers).
namespace TessikSDK::GeomBind {

/// Whether bindings write to standard output: the phase lines of a binding run without a progress
/// object, and the geodesic method's stage timing table. On unless a host turns it off; process-wide,
/// read when a run prints, so set it before binding rather than during a run.
TESSIK_API void setConsoleReports(bool enabled);
TESSIK_API bool consoleReports();

/// One influence of a bone on a vertex.
struct BoneWeight {
  std::uint32_t boneIndex;  ///< node index in the hierarchy, in the order the nodes were added
  double weight;
};

/// Progress and cancellation of a binding run. A host may implement it; when a binding gets none, the
/// library prints one line per phase to stdout ("Starting <title> ... done ").
class TESSIK_API IProgress {
 public:
  virtual ~IProgress();
  /// A phase starts; `title` is a zero-terminated label, `total` and `start` its range.
  virtual void begin(const char* title, int total, int start) = 0;
  /// The current phase is over.
  virtual void end() = 0;
  virtual void setRange(int total, int start) = 0;
  /// Progress within the phase; the answer is ignored. May be called from worker threads.
  virtual bool update(int value) = 0;
  /// True when the run is to stop: each remaining piece of work is skipped and the result comes back
  /// empty. May be called from worker threads, so it must be thread-safe.
  virtual bool isCanceled() = 0;
};

/// A progress object that reports nothing and never cancels, for hosts that want a binding quiet.
class TESSIK_API NullProgress final : public IProgress {
 public:
  ~NullProgress() override;
  void begin(const char* title, int total, int start) override;
  void end() override;
  void setRange(int total, int start) override;
  bool update(int value) override;
  bool isCanceled() override;
};

/// The weights of the last binding run on a context. Owned by the context: never dispose it; it is
/// replaced by the context's next binding.
class TESSIK_API ISparseVertexWeights {
 public:
  /// One entry per mesh vertex, or 0 when the binding failed.
  virtual std::size_t numVertices() = 0;
  /// Influences listed for `vertex`; 0 for a vertex at or past numVertices().
  virtual unsigned int numWeights(unsigned int vertex) = 0;
  /// Influence `index` of `vertex`; {0, 0.0} when either is out of range.
  virtual BoneWeight getWeight(unsigned int vertex, unsigned int index) = 0;

 protected:
  virtual ~ISparseVertexWeights();
};

/// The mesh to bind: vertices and triangles, appended in order. A binding moves the positions into a
/// unit frame in place, so fill the mesh completely before binding it; a later binding of the same mesh
/// starts again from the positions as they were added, and so gives the same weights.
class TESSIK_API IMesh {
 public:
  static IMesh* create();
  /// Null is ignored.
  static void dispose(IMesh* mesh);

  virtual void addVertex(float x, float y, float z) = 0;
  /// Vertex indices are checked when binding: a triangle naming a vertex that does not exist makes the
  /// binding return an empty result.
  virtual void addTriangle(unsigned int a, unsigned int b, unsigned int c) = 0;

 protected:
  virtual ~IMesh();
};

/// The bones: named nodes with 4x4 transforms and parent names, in any order. A node's index is the
/// order in which it was added; parents are resolved by name when a binding runs.
class TESSIK_API ITransformHierarchy {
 public:
  static ITransformHierarchy* create();
  /// Null is ignored.
  static void dispose(ITransformHierarchy* hierarchy);

  /// `matrix` is sixteen doubles, row by row, translation in elements 3, 7 and 11; the translation is
  /// the joint position. `parentName` null or empty makes a root. Answers false, adding nothing, for a
  /// null or empty `name`, a name already present, or a null `matrix`.
  virtual bool addNode(const char* name, const double* matrix, const char* parentName) = 0;
  virtual void clear() = 0;

 protected:
  virtual ~ITransformHierarchy();
};

/// A binding context. Made by `create` on a thread whose current OpenGL context offers version 2.1 or
/// later, or by `createWithoutOpenGL` anywhere.
class TESSIK_API IContext {
 public:
  /// Null when no OpenGL context is current on this thread or it lacks OpenGL 2.1.
  static IContext* create();
  /// A context that issues no OpenGL call and needs neither a GL context nor a GL library: the geodesic
  /// method voxelises the mesh's inside on the processor, deciding what the GPU sweeps decide (the two
  /// may differ only on voxels within half a voxel of the surface), in parallel and with the same result
  /// for any thread count. The heat-diffusion method is the same in both kinds of context. Released by
  /// `dispose` like any other.
  static IContext* createWithoutOpenGL();
  /// Null is ignored. Releases the context's result too.
  static void dispose(IContext* context);

  /// Takes no action.
  virtual void reserved() = 0;

  /// Geodesic sparse-voxel binding. A context from `create` needs its OpenGL context current on this
  /// thread; one from `createWithoutOpenGL` needs none. `falloff` is
  /// clamped to [0, 1] (0 soft, 1 sharp); `influenceLimit` 0 keeps every influence; `resolution` is
  /// the voxel count along the longest side. Mesh and hierarchy are rewritten in place (unit frame,
  /// joints as pure translations). Returns the context's result, never null; empty on failure.
  virtual ISparseVertexWeights* bindGeodesicSparseVoxel(IMesh* mesh,
                                                        ITransformHierarchy* hierarchy,
                                                        IProgress* progress,
                                                        float falloff,
                                                        unsigned int influenceLimit,
                                                        int resolution,
                                                        bool refineInterior) = 0;

  /// Heat-diffusion binding. Issues no OpenGL calls (a context from `create` still had to be created with
  /// a GL context current). Arguments and result as bindGeodesicSparseVoxel, without the voxel options.
  virtual ISparseVertexWeights* bindHeatmap(IMesh* mesh,
                                            ITransformHierarchy* hierarchy,
                                            IProgress* progress,
                                            float falloff,
                                            unsigned int influenceLimit) = 0;

 protected:
  virtual ~IContext();
};

}  // namespace TessikSDK::GeomBind
