#include "bind_tool.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <iomanip>
#include <limits>
#include <optional>
#include <sstream>
#include <stdexcept>

#include <GL/glew.h>

#include "asset_import.h"
#include "csv_export.h"
#include "default_character.h"
#include "gltf_export.h"
#include "headless_gl/headless_gl.h"
#include "output_files.h"
#include "piece_binding.h"
#include "preview.h"
#include "skeleton_json.h"
#include "weld.h"

namespace tessik::bind {
namespace {

namespace gb = TessikSDK::GeomBind;
using Clock = std::chrono::steady_clock;

bool endsWith(const std::string& s, const std::string& suffix) {
  if (s.size() < suffix.size()) return false;
  return std::equal(suffix.rbegin(), suffix.rend(), s.rbegin(),
                    [](char a, char b) { return std::tolower(static_cast<unsigned char>(a)) == b; });
}

// Passes everything on and keeps each phase's wall time for the summary.
class PhaseClock final : public gb::IProgress {
 public:
  explicit PhaseClock(gb::IProgress& inner) : inner_(inner) {}
  void begin(const char* title, int total, int start) override {
    title_ = title != nullptr ? title : "";
    began_ = Clock::now();
    inner_.begin(title, total, start);
  }
  void end() override {
    phases.emplace_back(title_, std::chrono::duration<double>(Clock::now() - began_).count());
    inner_.end();
  }
  void setRange(int total, int start) override { inner_.setRange(total, start); }
  bool update(int value) override { return inner_.update(value); }
  bool isCanceled() override { return inner_.isCanceled(); }

  std::vector<std::pair<std::string, double>> phases;

 private:
  gb::IProgress& inner_;
  std::string title_;
  Clock::time_point began_;
};

struct Failure : std::runtime_error {
  Failure(int status, const std::string& what) : std::runtime_error(what), status(status) {}
  int status;
};

// A vertex the binding left without weight (a shell no bone reaches, say) still has to be written with
// one; it follows the joint nearest to it, which is what a user would paint by hand first.
std::size_t giveOrphansNearestJoint(const SurfaceMesh& mesh,
                                    const Skeleton& skeleton,
                                    VertexWeights& weights) {
  std::size_t orphans = 0;
  VertexWeights filled;
  filled.offsets.reserve(weights.offsets.size());
  for (std::size_t v = 0; v < weights.numVertices(); ++v) {
    if (weights.begin(v) == weights.end(v)) {
      ++orphans;
      std::uint32_t best = 0;
      double bestDistance = std::numeric_limits<double>::infinity();
      for (std::size_t j = 0; j < skeleton.joints.size(); ++j) {
        const Vec3f t = translationOf(skeleton.joints[j].bindPose);
        const double dx = t[0] - mesh.positions[v][0], dy = t[1] - mesh.positions[v][1],
                     dz = t[2] - mesh.positions[v][2];
        const double d = dx * dx + dy * dy + dz * dz;
        if (d < bestDistance) {
          bestDistance = d;
          best = static_cast<std::uint32_t>(j);
        }
      }
      filled.influences.push_back({best, 1.0f});
    } else {
      filled.influences.insert(filled.influences.end(), weights.influences.begin() + weights.begin(v),
                               weights.influences.begin() + weights.end(v));
    }
    filled.offsets.push_back(static_cast<std::uint32_t>(filled.influences.size()));
  }
  weights = std::move(filled);
  return orphans;
}

// Forwards only cancellation, so that binding many pieces one by one does not flood the terminal.
class QuietProgress final : public gb::IProgress {
 public:
  explicit QuietProgress(gb::IProgress& inner) : inner_(inner) {}
  void begin(const char*, int, int) override {}
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override { return true; }
  bool isCanceled() override { return inner_.isCanceled(); }

 private:
  gb::IProgress& inner_;
};

// The tool's own context, unless the host (a test, say) already made one current.
std::optional<support::HeadlessGLContext> ensureGLContext() {
  if (!support::currentGLVersionString().empty()) return std::nullopt;
  std::string error;
  std::optional<support::HeadlessGLContext> context = support::HeadlessGLContext::create(&error);
  if (!context.has_value())
    throw Failure(kExitFailed,
                  "no OpenGL context could be made without a display, and the binding library needs one for "
                  "either method (--method heatmap included). Details:\n" +
                      error);
  // Debian's GLEW is built for GLX: in an EGL context it loads every entry point, then reports only that it
  // found no X display.
  const GLenum glew = glewInit();
  if (glew != GLEW_OK && glew != GLEW_ERROR_NO_GLX_DISPLAY)
    throw Failure(kExitFailed, std::string("OpenGL entry points could not be loaded: ") +
                                   reinterpret_cast<const char*>(glewGetErrorString(glew)));
  return context;
}

std::string seconds(double s) {
  std::ostringstream os;
  os << std::fixed << std::setprecision(s < 10 ? 2 : 1) << s << " s";
  return os.str();
}

}  // namespace

std::vector<JointRotation> defaultCharacterPose() { return {{"l_elbow", 0.0, 0.0, 75.0}}; }

std::string validateOptions(const ToolOptions& o) {
  if (o.input.empty() && !o.skeletonPath.empty()) return "--skeleton needs an input mesh";
  if (!o.input.empty() && o.outputPath.empty() && o.csvPath.empty() && o.previewPath.empty())
    return "nothing to write: give -o OUT.glb, --csv FILE or --preview FILE.png";
  if (!o.outputPath.empty() && !endsWith(o.outputPath, ".glb") && !endsWith(o.outputPath, ".gltf"))
    return "-o must name a .glb or .gltf file, not '" + o.outputPath + "'";
  if (!o.previewPath.empty() && !endsWith(o.previewPath, ".png"))
    return "--preview must name a .png file, not '" + o.previewPath + "'";
  if (o.settings.resolution < 8 || o.settings.resolution > 1024)
    return "--resolution must be between 8 and 1024, not " + std::to_string(o.settings.resolution);
  if (!(o.settings.falloff >= 0.0f && o.settings.falloff <= 1.0f)) return "--falloff must be between 0 and 1";
  if (o.settings.maxInfluences > 64) return "--max-influences must be between 0 (all) and 64";
  if (o.previewSize < 16 || o.previewSize > 8192) return "--preview-size must be between 16 and 8192";
  return {};
}

int runBindTool(const ToolOptions& options,
                gb::IProgress& progress,
                const std::atomic<bool>* cancel,
                std::ostream& out,
                std::ostream& err) {
  ToolOptions o = options;
  if (o.input.empty()) {
    if (o.outputPath.empty()) o.outputPath = kDefaultOutput;
    if (o.previewPath.empty()) o.previewPath = kDefaultPreview;
    if (o.pose.empty()) o.pose = defaultCharacterPose();
  }
  const std::string invalid = validateOptions(o);
  if (!invalid.empty()) {
    err << "tessik-bind: " << invalid << "\n";
    return kExitUsage;
  }
  auto cancelled = [&] { return progress.isCanceled() || (cancel != nullptr && cancel->load()); };
  std::vector<std::pair<std::string, double>> times;
  auto timed = [&](const char* stage, auto&& work) {
    const Clock::time_point t0 = Clock::now();
    work();
    times.emplace_back(stage, std::chrono::duration<double>(Clock::now() - t0).count());
  };

  try {
    ImportedAsset asset;
    timed("import", [&] {
      if (o.input.empty()) {
        asset = defaultCharacter();
      } else {
        asset = importAsset(o.input, !o.skeletonPath.empty());
        if (!o.skeletonPath.empty()) asset.skeleton = readSkeletonJson(o.skeletonPath);
      }
    });
    const SurfaceMesh& mesh = asset.mesh;
    const Skeleton& skeleton = asset.skeleton;
    if (skeleton.joints.empty())
      throw Failure(kExitFailed,
                    "'" + o.input + "' has no skeleton: give its bones with --skeleton FILE.json");
    // A misspelt bone in --pose should fail now, not after a long binding.
    const std::vector<Mat4> posed = posedJointTransforms(skeleton, o.pose);

    WeldedMesh welded;
    std::size_t turnedPieces = 0;
    std::vector<std::uint32_t> pieceOf;
    std::size_t pieceCount = 0;
    timed("weld", [&] {
      welded = weldByPosition(mesh, defaultWeldTolerance(mesh));
      turnedPieces = orientPiecesOutward(welded.mesh);
      pieceCount = labelPieces(welded.mesh, pieceOf);
    });
    if (welded.mesh.triangles.empty())
      throw Failure(kExitFailed, "'" + o.input + "' has only degenerate triangles");

    const std::optional<support::HeadlessGLContext> context = ensureGLContext();
    PhaseClock clock(progress);
    VertexWeights weldedWeights;
    std::optional<std::size_t> unboundPieces;
    timed("bind", [&] {
      weldedWeights = bindSurface(welded.mesh, skeleton, o.settings, &clock);
      if (weldedWeights.numVertices() == 0 && pieceCount > 1 && !cancelled()) {
        QuietProgress quiet(clock);
        PieceBinding byPiece = bindInGroups(
            welded.mesh, pieceOf, pieceCount,
            [&](const SurfaceMesh& group) { return bindSurface(group, skeleton, o.settings, &quiet); },
            clock);
        weldedWeights = std::move(byPiece.weights);
        unboundPieces = byPiece.unboundPieces;
      }
    });
    if (cancelled()) throw Failure(kExitCancelled, "cancelled; nothing was written");
    if (weldedWeights.numVertices() == 0)
      throw Failure(kExitFailed, std::string("the ") + methodName(o.settings.method) +
                                     " binding came back empty (no bone could be reached from the surface); "
                                     "nothing was written");

    std::size_t influenceCount = weldedWeights.influences.size();
    std::size_t maxInfluences = 0;
    for (std::size_t v = 0; v < weldedWeights.numVertices(); ++v)
      maxInfluences = std::max<std::size_t>(maxInfluences, weldedWeights.end(v) - weldedWeights.begin(v));
    const std::size_t orphans = giveOrphansNearestJoint(welded.mesh, skeleton, weldedWeights);
    const VertexWeights weights = unweldWeights(weldedWeights, welded.weldOf);

    PendingOutputs files;
    if (o.input.empty()) {
      // The built-in run writes into out/ by default, which a fresh checkout does not have.
      for (const std::string* path : {&o.outputPath, &o.previewPath, &o.csvPath}) {
        const std::filesystem::path folder = std::filesystem::path(*path).parent_path();
        if (!folder.empty()) std::filesystem::create_directories(folder);
      }
    }
    timed("write", [&] {
      if (!o.outputPath.empty())
        writeSkinnedGltf(files.stage(o.outputPath), mesh, skeleton, weights, endsWith(o.outputPath, ".glb"));
      if (!o.csvPath.empty()) writeWeightsCsv(files.stage(o.csvPath), skeleton, weights);
    });
    if (!o.previewPath.empty()) {
      timed("preview", [&] {
        const SurfaceMesh shown =
            o.pose.empty() ? welded.mesh : deformMesh(welded.mesh, skeleton, posed, weldedWeights);
        std::vector<Mat4> bindPoses;
        for (const Joint& j : skeleton.joints) bindPoses.push_back(j.bindPose);
        PreviewOptions view;
        view.width = view.height = o.previewSize;
        renderPreview(files.stage(o.previewPath), shown, skeleton, o.pose.empty() ? bindPoses : posed,
                      weldedWeights, view);
      });
    }
    if (cancelled()) throw Failure(kExitCancelled, "cancelled; nothing was written");
    files.commit();

    const std::string name = o.input.empty() ? "built-in character" : o.input;
    out << "tessik-bind: " << name << "\n"
        << "  vertices    " << mesh.positions.size() << " (" << welded.mesh.positions.size()
        << " after welding seams)\n"
        << "  pieces      " << pieceCount
        << (turnedPieces > 0 ? " (" + std::to_string(turnedPieces) + " wound inside out, turned for binding)"
                             : std::string())
        << "\n"
        << "  triangles   " << mesh.triangles.size() << "\n"
        << "  bones       " << skeleton.joints.size() << "\n"
        << "  method      " << methodName(o.settings.method);
    if (o.settings.method == BindMethod::geodesic) out << ", resolution " << o.settings.resolution;
    out << ", falloff " << o.settings.falloff << ", max influences " << o.settings.maxInfluences
        << (o.settings.refineInterior ? ", interior refined" : "") << "\n";
    if (unboundPieces.has_value()) {
      out << "  by piece    the whole surface could not be bound, so its pieces were bound in groups";
      if (*unboundPieces > 0)
        out << "; " << *unboundPieces << " saw no bone and took the weights of the nearest bound piece";
      out << "\n";
    }
    out << "  influences  mean " << std::fixed << std::setprecision(2)
        << static_cast<double>(influenceCount) / static_cast<double>(welded.mesh.positions.size()) << ", max "
        << maxInfluences << " per vertex\n";
    out.unsetf(std::ios::fixed);
    out << "  no weight   " << orphans << " vertices" << (orphans > 0 ? " (given to their nearest bone)" : "")
        << "\n";
    out << "  time        ";
    for (std::size_t i = 0; i < times.size(); ++i)
      out << (i ? ", " : "") << times[i].first << " " << seconds(times[i].second);
    out << "\n";
    for (const auto& [phase, s] : clock.phases)
      out << "    " << std::left << std::setw(44) << phase << seconds(s) << "\n";
    for (const std::string* path : {&o.outputPath, &o.csvPath, &o.previewPath})
      if (!path->empty()) out << "  wrote       " << *path << "\n";
    return kExitOk;
  } catch (const Failure& f) {
    err << "tessik-bind: " << f.what() << "\n";
    return f.status;
  } catch (const std::exception& e) {
    err << "tessik-bind: " << e.what() << "\n";
    return kExitFailed;
  }
}

}  // namespace tessik::bind
