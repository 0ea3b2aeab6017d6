#include "tessik/pipeline.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <utility>

#include "gl/gl_api.h"
#include "pipeline/enclosed_bones.h"
#include "pipeline/influences.h"
#include "pipeline/input_check.h"
#include "pipeline/leaf_tips.h"
#include "pipeline/piece_binding.h"
#include "pipeline/weld.h"

namespace TessikSDK::Pipeline {
namespace {

namespace gb = TessikSDK::GeomBind;
using Clock = std::chrono::steady_clock;

// Only the geodesic method voxelises. Automatic asks whether the caller's thread has a hardware context
// without loading a GL library the process lacks: without one no context can be current.
bool interiorOnGpu(const Options& options) {
  if (options.method != Method::geodesic || options.voxelizer == Voxelizer::cpu) return false;
  if (options.voxelizer == Voxelizer::gpu) return true;
  return GL::libraryInProcess() && GL::load() && GL::versionAtLeast(2, 1) && !GL::softwareRenderer();
}

template <typename T>
struct Disposer {
  void operator()(T* p) const { T::dispose(p); }
};
template <typename T>
using Owned = std::unique_ptr<T, Disposer<T>>;

// Passes everything on to the host and keeps each phase's wall time for the report. A method may begin
// a phase while another is open (the geodesic method's voxelizing runs straight into extraction); the
// open one ends there.
class PhaseClock final : public gb::IProgress {
 public:
  explicit PhaseClock(gb::IProgress& inner) : inner_(inner) {}
  void begin(const char* title, int total, int start) override {
    close();
    title_ = title != nullptr ? title : "";
    began_ = Clock::now();
    open_ = true;
    inner_.begin(title, total, start);
  }
  void end() override {
    close();
    inner_.end();
  }
  void setRange(int total, int start) override { inner_.setRange(total, start); }
  bool update(int value) override { return inner_.update(value); }
  bool isCanceled() override { return inner_.isCanceled(); }

  std::vector<std::pair<std::string, double>> phases;

 private:
  void close() {
    if (open_) phases.emplace_back(title_, std::chrono::duration<double>(Clock::now() - began_).count());
    open_ = false;
  }

  gb::IProgress& inner_;
  std::string title_;
  Clock::time_point began_;
  bool open_ = false;
};

// Forwards only cancellation, so that binding many groups one by one does not flood the host's display.
class CancelOnly final : public gb::IProgress {
 public:
  explicit CancelOnly(gb::IProgress& inner) : inner_(inner) {}
  void begin(const char*, int, int) override {}
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override { return false; }
  bool isCanceled() override { return inner_.isCanceled(); }

 private:
  gb::IProgress& inner_;
};

// Callbacks seen as the library's progress object. The phase's range arrives with its start, and
// update() comes from worker threads while begin() comes from the binding thread, hence the lock.
class CallbackProgress final : public gb::IProgress {
 public:
  explicit CallbackProgress(const Callbacks& callbacks) : callbacks_(callbacks) {}
  void begin(const char* title, int total, int start) override {
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      phase_ = title != nullptr ? title : "";
      total_ = total;
      start_ = start;
    }
    report(0.0);
  }
  void end() override { report(1.0); }
  void setRange(int total, int start) override {
    const std::lock_guard<std::mutex> lock(mutex_);
    total_ = total;
    start_ = start;
  }
  bool update(int value) override {
    double fraction = 0.0;
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      if (total_ > start_)
        fraction =
            std::clamp(static_cast<double>(value - start_) / static_cast<double>(total_ - start_), 0.0, 1.0);
    }
    report(fraction);
    return false;
  }
  bool isCanceled() override { return callbacks_.cancelled && callbacks_.cancelled(); }

 private:
  void report(double fraction) {
    if (!callbacks_.progress) return;
    std::string phase;
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      phase = phase_;
    }
    callbacks_.progress(phase, fraction);
  }

  const Callbacks& callbacks_;
  std::mutex mutex_;
  std::string phase_;
  int total_ = 0;
  int start_ = 0;
};

// One node of the binding hierarchy: a caller's bone, or a leaf tip that stands for its leaf.
struct Node {
  std::string name;
  std::string parent;
  Matrix4x4 matrix;
};

std::vector<Node> bindingNodes(const std::vector<Bone>& bones,
                               const std::vector<LeafTip>& tips,
                               std::vector<std::uint32_t>& boneOfNode) {
  std::vector<Node> nodes;
  boneOfNode.clear();
  for (std::uint32_t b = 0; b < bones.size(); ++b) {
    const Bone& bone = bones[b];
    nodes.push_back({bone.name,
                     bone.parent >= 0 ? bones[static_cast<std::size_t>(bone.parent)].name : std::string(),
                     bone.bindPose});
    boneOfNode.push_back(b);
  }
  std::set<std::string> taken;
  for (const Bone& bone : bones) taken.insert(bone.name);
  for (const LeafTip& tip : tips) {
    // Names only link tips to their leaves inside the binding; they must not collide with the caller's.
    std::string name = bones[tip.leaf].name + " tip";
    while (!taken.insert(name).second) name += "'";
    const auto& p = tip.position;
    nodes.push_back({name, bones[tip.leaf].name, {1, 0, 0, p[0], 0, 1, 0, p[1], 0, 0, 1, p[2], 0, 0, 0, 1}});
    boneOfNode.push_back(tip.leaf);
  }
  return nodes;
}

// One run of the library's method on `mesh`; no vertices when it failed.
Weights bindOnce(gb::IContext& context,
                 const Mesh& mesh,
                 const std::vector<Node>& nodes,
                 const Options& options,
                 unsigned influenceLimit,
                 gb::IProgress& progress) {
  const Owned<gb::IMesh> target(gb::IMesh::create());
  const Owned<gb::ITransformHierarchy> hierarchy(gb::ITransformHierarchy::create());
  for (const auto& p : mesh.positions) target->addVertex(p[0], p[1], p[2]);
  for (const auto& t : mesh.triangles) target->addTriangle(t[0], t[1], t[2]);
  for (const Node& n : nodes)
    hierarchy->addNode(n.name.c_str(), n.matrix.data(), n.parent.empty() ? nullptr : n.parent.c_str());
  gb::ISparseVertexWeights* result =
      options.method == Method::geodesic
          ? context.bindGeodesicSparseVoxel(target.get(), hierarchy.get(), &progress, options.falloff,
                                            influenceLimit, options.resolution, options.refineInterior)
          : context.bindHeatmap(target.get(), hierarchy.get(), &progress, options.falloff, influenceLimit);
  Weights weights;
  if (result->numVertices() != mesh.positions.size()) return weights;
  weights.offsets.reserve(mesh.positions.size() + 1);
  for (unsigned v = 0; v < mesh.positions.size(); ++v) {
    for (unsigned i = 0; i < result->numWeights(v); ++i) {
      const gb::BoneWeight w = result->getWeight(v, i);
      if (w.weight > 0.0 && w.boneIndex < nodes.size()) weights.influences.push_back({w.boneIndex, w.weight});
    }
    weights.offsets.push_back(static_cast<std::uint32_t>(weights.influences.size()));
  }
  return weights;
}

}  // namespace

BindError::BindError(Kind kind, const std::string& message) : std::runtime_error(message), kind_(kind) {}
BindError::~BindError() = default;

std::string validateOptions(const Options& o) {
  if (o.method != Method::geodesic && o.method != Method::heatmap)
    return "method must be geodesic or heatmap";
  if (o.resolution < Limits::minResolution || o.resolution > Limits::maxResolution)
    return "resolution must be between " + std::to_string(Limits::minResolution) + " and " +
           std::to_string(Limits::maxResolution) + ", got " + std::to_string(o.resolution);
  if (!(o.falloff >= 0.0f && o.falloff <= 1.0f))
    return "falloff must be between 0 (soft) and 1 (sharp), got " + std::to_string(o.falloff);
  if (o.maxInfluences > Limits::maxInfluences)
    return "max influences must be between 0 (keep all) and " + std::to_string(Limits::maxInfluences) +
           ", got " + std::to_string(o.maxInfluences);
  return {};
}

Result bindSkin(const Mesh& mesh,
                const std::vector<Bone>& bones,
                const Options& options,
                gb::IProgress* progress) {
  for (const std::string& fault : {validateOptions(options), checkMesh(mesh), checkBones(bones)})
    if (!fault.empty()) throw BindError(BindError::Kind::invalidInput, fault);
  if (const std::string fault = checkSkeletonMeetsMesh(mesh, bones); !fault.empty())
    throw BindError(BindError::Kind::invalidInput, fault);

  // The library's console output belongs to the host's terminal or log, not to every call.
  struct ConsoleReports {
    explicit ConsoleReports(bool enabled) : before(gb::consoleReports()) { gb::setConsoleReports(enabled); }
    ~ConsoleReports() { gb::setConsoleReports(before); }
    bool before;
  } console(options.verbose);

  NullProgress silent;
  PhaseClock clock(progress != nullptr ? *progress : silent);
  auto phase = [&](const char* title, auto&& work) {
    clock.begin(title, 0, 0);
    work();
    clock.end();
  };
  auto cancelled = [&] {
    if (clock.isCanceled()) throw BindError(BindError::Kind::cancelled, "the binding was cancelled");
  };

  Result result;
  Report& report = result.report;
  WeldedMesh welded;
  std::vector<std::uint32_t> pieceOf;
  phase("Welding seams and orienting pieces", [&] {
    welded = weldByPosition(mesh, defaultWeldTolerance(mesh));
    report.droppedTriangles = dropFlatTriangles(welded.mesh);
    report.turnedPieces = orientPiecesOutward(welded.mesh);
    report.pieces = labelPieces(welded.mesh, pieceOf);
  });
  report.weldedVertices = welded.mesh.positions.size();
  if (welded.mesh.triangles.empty())
    throw BindError(BindError::Kind::invalidInput, "every triangle of the mesh is degenerate");
  cancelled();

  TipPlacement tips;
  if (options.leafTips) phase("Placing leaf tips", [&] { tips = placeLeafTips(welded.mesh, bones); });
  for (const LeafTip& tip : tips.tips) ++(tip.fromSkeleton ? report.tipsFromSkeleton : report.tipsCast);
  report.leavesWithoutTip = tips.leavesWithoutTip;
  std::vector<std::uint32_t> boneOfNode;
  const std::vector<Node> nodes = bindingNodes(bones, tips.tips, boneOfNode);
  // The method's own cut would count a leaf and its tip apart; with tips the cut comes after folding.
  const unsigned methodLimit = tips.tips.empty() ? options.maxInfluences : 0u;

  report.interiorOnGpu = interiorOnGpu(options);
  const Owned<gb::IContext> context(report.interiorOnGpu ? gb::IContext::create()
                                                         : gb::IContext::createWithoutOpenGL());
  if (!context)
    throw BindError(BindError::Kind::noOpenGL,
                    "the GPU voxelizer was asked for, and no OpenGL 2.1 context is current on this thread");
  std::vector<bool> unboundPiece;
  Weights nodeWeights = bindOnce(*context, welded.mesh, nodes, options, methodLimit, clock);
  cancelled();
  if (nodeWeights.numVertices() == 0 && report.pieces > 1) {
    CancelOnly quiet(clock);
    PieceBinding byPiece = bindInGroups(
        welded.mesh, pieceOf, report.pieces,
        [&](const Mesh& group) { return bindOnce(*context, group, nodes, options, methodLimit, quiet); },
        clock);
    cancelled();
    nodeWeights = std::move(byPiece.weights);
    report.boundByPiece = true;
    report.unboundPieces = byPiece.unboundPieces;
    for (bool bound : byPiece.pieceBound) unboundPiece.push_back(!bound);
  }
  if (nodeWeights.numVertices() == 0)
    throw BindError(BindError::Kind::noWeights,
                    std::string("the ") + (options.method == Method::geodesic ? "geodesic" : "heatmap") +
                        " binding came back empty: no bone could be reached from the surface");

  Weights finished;
  phase("Finishing weights", [&] {
    finished = foldAndLimit(nodeWeights, boneOfNode, options.maxInfluences);
    if (report.unboundPieces > 0)
      report.piecesGivenEnclosedBones =
          giveEnclosedBones(welded.mesh, pieceOf, unboundPiece, bones, tips.tips, finished);
    report.orphanVertices = giveOrphansNearestJoint(welded.mesh, bones, finished);
    for (std::size_t v = 0; v < finished.numVertices(); ++v)
      report.maxInfluences = std::max<std::size_t>(report.maxInfluences, finished.end(v) - finished.begin(v));
    report.meanInfluences =
        static_cast<double>(finished.influences.size()) / static_cast<double>(finished.numVertices());
    result.weights = unweldWeights(finished, welded.weldOf);
  });
  report.phases = std::move(clock.phases);
  return result;
}

Result bindSkin(const Mesh& mesh,
                const std::vector<Bone>& bones,
                const Options& options,
                const Callbacks& callbacks) {
  CallbackProgress progress(callbacks);
  return bindSkin(mesh, bones, options, &progress);
}

}  // namespace TessikSDK::Pipeline
