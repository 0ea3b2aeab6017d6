// tessik-bind: binds a mesh to its skeleton and writes the skinned asset, a weight table and a picture.

#include <atomic>
#include <csignal>
#include <iostream>
#include <stdexcept>

#include <CLI/CLI.hpp>

#include "bind_tool.h"
#include "terminal_progress.h"

namespace {

std::atomic<bool> g_cancel{false};
static_assert(std::atomic<bool>::is_always_lock_free, "the signal handler may only touch lock-free atomics");

extern "C" void onInterrupt(int) { g_cancel.store(true); }

void installInterruptHandler() {
  struct sigaction action {};
  action.sa_handler = onInterrupt;
  sigemptyset(&action.sa_mask);
  // A second Ctrl-C ends the process at once, for a user who will not wait for the binding to wind down.
  action.sa_flags = SA_RESETHAND;
  sigaction(SIGINT, &action, nullptr);
  sigaction(SIGTERM, &action, nullptr);
  // Past a file-size limit the write itself fails and the run reports it, removing its temporaries;
  // the signal's default would kill the process and leave them behind.
  signal(SIGXFSZ, SIG_IGN);
}

}  // namespace

int main(int argc, char** argv) {
  using tessik::bind::BindMethod;
  tessik::bind::ToolOptions options;
  std::vector<std::string> poses;
  std::string method = "geodesic";

  CLI::App app{
      "Binds a mesh to its skeleton and writes it as a skinned glTF asset.\n"
      "Reads what assimp reads (glTF/GLB, FBX, COLLADA, X, SMD, IQM, MS3D, OBJ, PLY, STL, ...). With no "
      "INPUT it\n"
      "binds a built-in character and writes out/character.glb and out/character.png with its left arm bent.",
      "tessik-bind"};
  app.add_option("input", options.input, "mesh with its skeleton (or with --skeleton for one without)");
  app.add_option("-o,--output", options.outputPath, "skinned asset to write: .glb or .gltf");
  app.add_option("--skeleton", options.skeletonPath,
                 "bones as JSON, for meshes without a skeleton (see README)");
  app.add_option("--method", method, "binding method")
      ->check(CLI::IsMember({"geodesic", "heatmap"}))
      ->capture_default_str();
  app.add_option("--resolution", options.settings.resolution,
                 "voxels along the longest side (geodesic method)")
      ->check(
          CLI::Range(TessikSDK::Pipeline::Limits::minResolution, TessikSDK::Pipeline::Limits::maxResolution))
      ->capture_default_str();
  app.add_option("--falloff", options.settings.falloff, "0 soft to 1 sharp transitions between bones")
      ->check(CLI::Range(0.0f, 1.0f))
      ->capture_default_str();
  app.add_option("--max-influences", options.settings.maxInfluences,
                 "bones kept per vertex, strongest first; 0 keeps all")
      ->check(CLI::Range(0u, TessikSDK::Pipeline::Limits::maxInfluences))
      ->capture_default_str();
  app.add_flag(
      "--refine-interior", options.settings.refineInterior,
      "voxelise the inside at full resolution too (geodesic method; slower, for thin or nested parts)");
  std::string voxelizer = "auto";
  app.add_option(
         "--voxelizer", voxelizer,
         "where the geodesic method voxelises the inside: auto takes a hardware GPU when there is "
         "one and the processor otherwise (also for the preview); gpu needs OpenGL; cpu never loads it")
      ->check(CLI::IsMember({"auto", "gpu", "cpu"}))
      ->capture_default_str();
  bool noLeafTips = false;
  app.add_flag(
      "--no-leaf-tips", noLeafTips,
      "bind leaf bones (a head, a hand without fingers) by their joint alone, without a tip of their "
      "own");
  app.add_flag("--verbose", options.settings.verbose,
               "let the library print its own progress lines and stage timings");
  app.add_option("--csv", options.csvPath, "also write vertex,bone,weight rows");
  app.add_option("--preview", options.previewPath, "also draw the bound mesh, coloured by bone, into a PNG");
  app.add_option("--preview-size", options.previewSize, "preview width and height in pixels")
      ->check(CLI::Range(16, 8192))
      ->capture_default_str();
  app.add_option("--pose", poses,
                 "BONE=RX,RY,RZ: turn a bone (degrees, about its own axes) before the preview")
      ->take_all();
  try {
    app.parse(argc, argv);
  } catch (const CLI::CallForHelp& e) {
    return app.exit(e);
  } catch (const CLI::ParseError& e) {
    // One line and the usage status, as for every other bad option, whatever CLI11's own codes are.
    std::string line = e.what();
    line = line.substr(0, line.find('\n'));
    std::cerr << "tessik-bind: " << line << " (see --help)\n";
    return tessik::bind::kExitUsage;
  }

  options.settings.leafTips = !noLeafTips;
  using TessikSDK::Pipeline::Voxelizer;
  options.settings.voxelizer =
      voxelizer == "gpu" ? Voxelizer::gpu : (voxelizer == "cpu" ? Voxelizer::cpu : Voxelizer::automatic);
  options.settings.method = method == "heatmap" ? BindMethod::heatmap : BindMethod::geodesic;
  try {
    for (const std::string& p : poses) options.pose.push_back(tessik::bind::parseJointRotation(p));
  } catch (const std::invalid_argument& e) {
    std::cerr << "tessik-bind: " << e.what() << "\n";
    return tessik::bind::kExitUsage;
  }

  installInterruptHandler();
  tessik::bind::TerminalProgress progress(stderr, &g_cancel);
  return tessik::bind::runBindTool(options, progress, &g_cancel, std::cout, std::cerr);
}
