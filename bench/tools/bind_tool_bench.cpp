// What a user waits for and what the machine must hold: tessik-bind run as a process on the rigged test
// models of Debian's assimp-testmodels that it binds, once per method, and on the generated test
// character at about 200k vertices (an OBJ with a JSON skeleton, geodesic at resolution 64), writing a
// .glb. Each iteration starts a fresh process, so the figures include import, binding and export, as on
// a farm.
//
// The time is the process's wall time; peak_rss_mib is that process's own resident high-water mark
// (from wait4, so the benchmark's own memory is not in it). Assets the system lacks are skipped.

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "common/run_benchmarks.h"
#include "meshes/character.h"

namespace {

const char* const kAssets[] = {"X/Testwuson.X", "X/BCN_Epileptic.X", "FBX/animation_with_skeleton.fbx"};
const char* const kMethods[] = {"geodesic", "heatmap"};
constexpr const char* kCharacter = "character_200k";

struct Run {
  bool ok = false;
  double seconds = 0.0;
  double peakRssMiB = 0.0;
};

Run RunTool(const std::vector<std::string>& arguments) {
  std::vector<char*> argv;
  for (const std::string& a : arguments) argv.push_back(const_cast<char*>(a.c_str()));
  argv.push_back(nullptr);
  const auto start = std::chrono::steady_clock::now();
  const pid_t child = fork();
  if (child == 0) {
    // The tool's summary and progress would drown the benchmark's table.
    if (freopen("/dev/null", "w", stdout) == nullptr || freopen("/dev/null", "w", stderr) == nullptr)
      _exit(126);
    execv(argv[0], argv.data());
    _exit(127);
  }
  Run run;
  if (child < 0) return run;
  int status = 0;
  rusage usage{};
  if (wait4(child, &status, 0, &usage) != child) return run;
  run.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  run.peakRssMiB = static_cast<double>(usage.ru_maxrss) / 1024.0;  // KiB on Linux
  run.ok = WIFEXITED(status) && WEXITSTATUS(status) == 0;
  return run;
}

// The test character written as a user's OBJ and JSON skeleton; the paths of both.
std::vector<std::string> WriteCharacter(const std::string& directory, double detail) {
  const tessik::meshes::Character c = tessik::meshes::character(detail);
  const std::string obj = directory + "/character.obj", json = directory + "/character.json";
  std::ofstream mesh(obj);
  for (const auto& p : c.mesh.positions) mesh << "v " << p[0] << " " << p[1] << " " << p[2] << "\n";
  for (const auto& t : c.mesh.triangles)
    mesh << "f " << t[0] + 1 << " " << t[1] + 1 << " " << t[2] + 1 << "\n";
  std::ofstream bones(json);
  bones << "[";
  for (std::size_t b = 0; b < c.bones.size(); ++b) {
    const auto& bone = c.bones[b];
    bones << (b > 0 ? ",\n" : "") << "{\"name\": \"" << bone.name << "\", \"parent\": \"" << bone.parent
          << "\", \"position\": [" << bone.position[0] << ", " << bone.position[1] << ", " << bone.position[2]
          << "]}";
  }
  bones << "]\n";
  return {obj, "--skeleton", json};
}

// `asset` is a file under assimp's test models, or kCharacter for the generated character.
void BM_BindTool(benchmark::State& state, const std::string& asset, const std::string& method) {
  char pattern[] = "/tmp/tessik-bind-bench-XXXXXX";
  const char* made = mkdtemp(pattern);
  if (made == nullptr) {
    state.SkipWithError("no temporary directory");
    return;
  }
  const std::string directory = made;
  std::vector<std::string> input;
  if (asset == kCharacter) {
    input = WriteCharacter(directory, 8.0);
  } else {
    input = {std::string(TESSIK_ASSIMP_MODELS) + "/" + asset};
    struct stat info {};
    if (stat(input[0].c_str(), &info) != 0) {
      state.SkipWithError(("missing " + input[0]).c_str());
      std::filesystem::remove_all(directory);
      return;
    }
  }
  const std::string output = directory + "/out.glb";
  std::vector<std::string> command = {TESSIK_BIND_EXE};
  command.insert(command.end(), input.begin(), input.end());
  for (const std::string& more : {std::string("--method"), method, std::string("-o"), output})
    command.push_back(more);
  double peak = 0.0;
  for (auto _ : state) {
    const Run run = RunTool(command);
    if (!run.ok) {
      state.SkipWithError("tessik-bind failed");
      break;
    }
    state.SetIterationTime(run.seconds);
    if (run.peakRssMiB > peak) peak = run.peakRssMiB;
  }
  std::filesystem::remove_all(directory);
  state.counters["peak_rss_mib"] = peak;
}

}  // namespace

int main(int argc, char** argv) {
  for (const char* asset : kAssets)
    for (const char* method : kMethods)
      benchmark::RegisterBenchmark((std::string("BM_BindTool/") + asset + "/" + method).c_str(), BM_BindTool,
                                   std::string(asset), std::string(method))
          ->UseManualTime()
          ->Iterations(3)
          ->Unit(benchmark::kMillisecond);
  benchmark::RegisterBenchmark((std::string("BM_BindTool/") + kCharacter + "/geodesic").c_str(), BM_BindTool,
                               std::string(kCharacter), std::string("geodesic"))
      ->UseManualTime()
      ->Iterations(1)
      ->Unit(benchmark::kMillisecond);
  return tessik::bench::runBenchmarks(argc, argv);
}
