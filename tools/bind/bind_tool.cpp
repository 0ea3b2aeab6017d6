#include "bind_tool.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <filesystem>
#include <functional>
#include <iomanip>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <utility>

#include <sys/stat.h>

#include "asset_import.h"
#include "csv_export.h"
#include "default_character.h"
#include "gltf_export.h"
#include "headless_gl/headless_gl.h"
#include "output_files.h"
#include "preview.h"
#include "skeleton_json.h"

namespace tessik::bind {
namespace {

namespace gb = TessikSDK::GeomBind;
namespace pl = TessikSDK::Pipeline;
using Clock = std::chrono::steady_clock;

bool endsWith(const std::string& s, const std::string& suffix) {
  if (s.size() < suffix.size()) return false;
  return std::equal(suffix.rbegin(), suffix.rend(), s.rbegin(),
                    [](char a, char b) { return std::tolower(static_cast<unsigned char>(a)) == b; });
}

struct Failure : std::runtime_error {
  Failure(int status, const std::string& what) : std::runtime_error(what), status(status) {}
  int status;
};

// What a run has once its binding is done: everything the writers and the summary read.
struct BoundRun {
  const ToolOptions& options;
  ImportedAsset asset;
  std::vector<Mat4> posed;  // the joints as --pose turns them (their bind poses when none is given)
  BoundAsset bound;
  std::vector<std::pair<std::string, double>> times;  // per stage of the tool
  bool drawWithGL = false;  // a hardware (or asked-for) OpenGL context is current for the preview
};

// Every file the tool can write: the option that names it, the extensions it accepts, the stage whose
// time it counts in, and how it is written (to the staged path it is given).
struct OutputKind {
  const char* option;
  std::string ToolOptions::*path;
  std::vector<const char*> extensions;
  const char* stage;
  void (*write)(const std::string& staged, const BoundRun& run);
};

const std::vector<OutputKind>& outputKinds() {
  static const std::vector<OutputKind> kinds = {
      {"-o",
       &ToolOptions::outputPath,
       {".glb", ".gltf"},
       "write",
       [](const std::string& staged, const BoundRun& run) {
         writeSkinnedGltf(staged, run.asset.mesh, run.asset.skeleton, run.bound.weights,
                          endsWith(run.options.outputPath, ".glb"));
       }},
      {"--csv",
       &ToolOptions::csvPath,
       {},
       "write",
       [](const std::string& staged, const BoundRun& run) {
         writeWeightsCsv(staged, run.asset.skeleton, run.bound.weights);
       }},
      {"--preview",
       &ToolOptions::previewPath,
       {".png"},
       "preview",
       [](const std::string& staged, const BoundRun& run) {
         const SurfaceMesh& mesh = run.asset.mesh;
         const SurfaceMesh shown = run.options.pose.empty()
                                       ? mesh
                                       : deformMesh(mesh, run.asset.skeleton, run.posed, run.bound.weights);
         PreviewOptions view;
         view.width = view.height = run.options.previewSize;
         view.device = run.drawWithGL ? PreviewDevice::opengl : PreviewDevice::cpu;
         renderPreview(staged, shown, run.asset.skeleton, run.posed, run.bound.weights, view);
       }},
  };
  return kinds;
}

std::string seconds(double s) {
  std::ostringstream os;
  os << std::fixed << std::setprecision(s < 10 ? 2 : 1) << s << " s";
  return os.str();
}

// A file as the system knows it, links and other names for it resolved; empty when it does not exist.
std::optional<std::pair<dev_t, ino_t>> fileIdentity(const std::string& path) {
  struct stat info {};
  if (stat(path.c_str(), &info) != 0) return std::nullopt;
  return std::make_pair(info.st_dev, info.st_ino);
}

// Outputs must not overwrite an input or each other, and may replace only regular files: a run that
// overwrote its own mesh, or turned /dev/null into a file, would lose data the user still needs. Checked
// before importing, so a refused run costs nothing.
void checkOutputTargets(const ToolOptions& o) {
  namespace fs = std::filesystem;
  std::vector<std::pair<const char*, std::string>> inputs;
  if (!o.input.empty()) inputs.emplace_back("the input", o.input);
  if (!o.skeletonPath.empty()) inputs.emplace_back("the skeleton", o.skeletonPath);
  std::vector<std::pair<const char*, std::string>> earlier;
  for (const OutputKind& kind : outputKinds()) {
    const std::string& path = o.*kind.path;
    if (path.empty()) continue;
    const auto identity = fileIdentity(path);
    std::error_code ec;
    if (identity && !fs::is_regular_file(path, ec))
      throw Failure(kExitFailed,
                    std::string(kind.option) + " '" + path + "' is not a regular file; it is left alone");
    for (const auto& [role, input] : inputs)
      if (identity && identity == fileIdentity(input))
        throw Failure(kExitFailed, std::string(kind.option) + " '" + path + "' would overwrite " + role);
    for (const auto& [option, other] : earlier) {
      const bool same = identity ? identity == fileIdentity(other)
                                 : fs::weakly_canonical(path, ec) == fs::weakly_canonical(other, ec);
      if (same)
        throw Failure(kExitFailed, std::string(option) + " and " + kind.option + " both name '" + path + "'");
    }
    earlier.emplace_back(kind.option, path);
  }
}

ImportedAsset loadAsset(const ToolOptions& o) {
  if (o.input.empty()) return defaultCharacter();
  ImportedAsset asset = importAsset(o.input, !o.skeletonPath.empty());
  if (!o.skeletonPath.empty()) asset.skeleton = readSkeletonJson(o.skeletonPath);
  if (asset.skeleton.joints.empty())
    throw Failure(kExitFailed, "'" + o.input + "' has no skeleton: give its bones with --skeleton FILE.json");
  return asset;
}

// Whether the run uses OpenGL, for the geodesic voxelizer and the preview alike. `made` holds the headless
// context when the tool had to make one. Automatic keeps a context only when it renders in hardware:
// Mesa's software renderer is far slower than the processor paths, and with no GL library installed the
// attempt loads nothing and the processor does everything. Throws when the GPU was asked for and no
// context can be had.
bool acquireGL(const ToolOptions& o, std::optional<support::HeadlessGLContext>& made) {
  const pl::Voxelizer choice = o.settings.voxelizer;
  if (choice == pl::Voxelizer::cpu) return false;
  const bool geodesic = o.settings.method == BindMethod::geodesic;
  if (!geodesic && o.previewPath.empty()) return false;
  std::string error;
  const bool gpu = choice == pl::Voxelizer::gpu;
  if (support::acquireGLForGpuWork(made, gpu, &error)) return true;
  if (gpu && geodesic)
    throw Failure(
        kExitFailed,
        "--voxelizer gpu needs OpenGL, and no context could be made without a display (--voxelizer cpu "
        "needs none). Details:\n" +
            error);
  return false;
}

BoundAsset bindOrFail(const ImportedAsset& asset, const BindSettings& settings, gb::IProgress& progress) {
  try {
    return bindAsset(asset.mesh, asset.skeleton, settings, &progress);
  } catch (const pl::BindError& e) {
    if (e.kind() == pl::BindError::Kind::cancelled)
      throw Failure(kExitCancelled, "cancelled; nothing was written");
    if (e.kind() == pl::BindError::Kind::noWeights)
      throw Failure(kExitFailed, std::string(e.what()) + "; nothing was written");
    throw Failure(kExitFailed, e.what());
  }
}

void writeOutputs(const BoundRun& run,
                  const std::atomic<bool>* cancel,
                  gb::IProgress& progress,
                  std::vector<std::pair<std::string, double>>& times) {
  const ToolOptions& o = run.options;
  PendingOutputs files;
  for (const OutputKind& kind : outputKinds()) {
    const std::string& path = o.*kind.path;
    if (path.empty()) continue;
    // The built-in run writes into out/ by default, which a fresh checkout does not have.
    if (o.input.empty()) {
      const std::filesystem::path folder = std::filesystem::path(path).parent_path();
      if (!folder.empty()) std::filesystem::create_directories(folder);
    }
    const Clock::time_point t0 = Clock::now();
    kind.write(files.stage(path), run);
    const double s = std::chrono::duration<double>(Clock::now() - t0).count();
    const auto same =
        std::find_if(times.begin(), times.end(), [&](const auto& t) { return t.first == kind.stage; });
    if (same != times.end()) {
      same->second += s;
    } else {
      times.emplace_back(kind.stage, s);
    }
  }
  if (progress.isCanceled() || (cancel != nullptr && cancel->load()))
    throw Failure(kExitCancelled, "cancelled; nothing was written");
  files.commit();
}

void printSummary(const BoundRun& run, std::ostream& out) {
  const ToolOptions& o = run.options;
  const pl::Report& r = run.bound.report;
  const SurfaceMesh& mesh = run.asset.mesh;
  out << "tessik-bind: " << (o.input.empty() ? "built-in character" : o.input) << "\n"
      << "  vertices    " << mesh.positions.size() << " (" << r.weldedVertices << " after welding seams)\n"
      << "  pieces      " << r.pieces
      << (r.turnedPieces > 0
              ? " (" + std::to_string(r.turnedPieces) + " wound inside out, turned for binding)"
              : std::string())
      << "\n"
      << "  triangles   " << mesh.triangles.size()
      << (r.droppedTriangles > 0
              ? " (" + std::to_string(r.droppedTriangles) + " of no area left out of the binding)"
              : std::string())
      << "\n"
      << "  bones       " << run.asset.skeleton.joints.size() << "\n"
      << "  method      " << methodName(o.settings.method);
  if (o.settings.method == BindMethod::geodesic)
    out << ", resolution " << o.settings.resolution << ", interior voxelised on the "
        << (r.interiorOnGpu ? "GPU" : "CPU");
  out << ", falloff " << o.settings.falloff << ", max influences " << o.settings.maxInfluences
      << (o.settings.refineInterior ? ", interior refined" : "") << "\n";
  if (o.settings.leafTips) {
    out << "  leaf tips   " << r.tipsFromSkeleton << " from the skeleton, " << r.tipsCast << " cast";
    if (r.leavesWithoutTip > 0)
      out << ", " << r.leavesWithoutTip
          << " leaves without one (a lone root, or a joint outside the surface)";
    out << "\n";
  } else {
    out << "  leaf tips   off\n";
  }
  if (r.boundByPiece) {
    out << "  by piece    the whole surface could not be bound, so its pieces were bound in groups";
    if (r.piecesGivenEnclosedBones > 0)
      out << "; " << r.piecesGivenEnclosedBones << " saw no bone and went wholly to the bones inside them";
    if (r.unboundPieces > r.piecesGivenEnclosedBones)
      out << "; " << r.unboundPieces - r.piecesGivenEnclosedBones
          << " saw no bone and took the weights of the nearest bound piece";
    out << "\n";
  }
  out << "  influences  mean " << std::fixed << std::setprecision(2) << r.meanInfluences << ", max "
      << r.maxInfluences << " per vertex\n";
  out.unsetf(std::ios::fixed);
  out << "  no weight   " << r.orphanVertices << " vertices"
      << (r.orphanVertices > 0 ? " (given to their nearest bone)" : "") << "\n";
  out << "  time        ";
  for (std::size_t i = 0; i < run.times.size(); ++i)
    out << (i ? ", " : "") << run.times[i].first << " " << seconds(run.times[i].second);
  out << "\n";
  for (const auto& [phase, s] : r.phases)
    out << "    " << std::left << std::setw(44) << phase << seconds(s) << "\n";
  for (const OutputKind& kind : outputKinds())
    if (!(o.*kind.path).empty()) out << "  wrote       " << o.*kind.path << "\n";
}

}  // namespace

std::vector<JointRotation> defaultCharacterPose() { return {{"l_elbow", 0.0, 0.0, 75.0}}; }

std::string validateOptions(const ToolOptions& o) {
  if (o.input.empty() && !o.skeletonPath.empty()) return "--skeleton needs an input mesh";
  if (!o.input.empty() && o.outputPath.empty() && o.csvPath.empty() && o.previewPath.empty())
    return "nothing to write: give -o OUT.glb, --csv FILE or --preview FILE.png";
  for (const OutputKind& kind : outputKinds()) {
    const std::string& path = o.*kind.path;
    if (path.empty() || kind.extensions.empty()) continue;
    if (std::none_of(kind.extensions.begin(), kind.extensions.end(),
                     [&](const char* extension) { return endsWith(path, extension); })) {
      std::string accepted;
      for (const char* extension : kind.extensions)
        accepted += (accepted.empty() ? "" : " or ") + std::string(extension);
      return std::string(kind.option) + " must name a " + accepted + " file, not '" + path + "'";
    }
  }
  const std::string binding = pl::validateOptions(pipelineOptions(o.settings));
  if (!binding.empty()) return binding;
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
  std::vector<std::pair<std::string, double>> times;
  auto timed = [&](const char* stage, auto&& work) {
    const Clock::time_point t0 = Clock::now();
    auto result = work();
    times.emplace_back(stage, std::chrono::duration<double>(Clock::now() - t0).count());
    return result;
  };

  try {
    checkOutputTargets(o);
    ImportedAsset asset = timed("import", [&] { return loadAsset(o); });
    // A misspelt bone in --pose should fail now, not after a long binding.
    std::vector<Mat4> posed = posedJointTransforms(asset.skeleton, o.pose);
    std::optional<support::HeadlessGLContext> context;
    const bool withGL = acquireGL(o, context);
    BoundAsset bound = timed("bind", [&] { return bindOrFail(asset, o.settings, progress); });
    if (progress.isCanceled() || (cancel != nullptr && cancel->load()))
      throw Failure(kExitCancelled, "cancelled; nothing was written");
    BoundRun run{o, std::move(asset), std::move(posed), std::move(bound), {}, withGL};
    writeOutputs(run, cancel, progress, times);
    run.times = std::move(times);
    printSummary(run, out);
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
