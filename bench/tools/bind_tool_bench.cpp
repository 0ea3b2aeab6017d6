// What a user waits for and what the machine must hold: tessik-bind run as a process on the rigged test
// models of Debian's assimp-testmodels that it binds, once per method, writing a .glb. Each iteration
// starts a fresh process, so the figures include import, binding and export, as on a farm.
//
// The time is the process's wall time; peak_rss_mib is that process's own resident high-water mark
// (from wait4, so the benchmark's own memory is not in it). Assets the system lacks are skipped.

#include <chrono>
#include <cstdlib>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "common/run_benchmarks.h"

namespace {

const char* const kAssets[] = {"X/Testwuson.X", "X/BCN_Epileptic.X", "FBX/animation_with_skeleton.fbx"};
const char* const kMethods[] = {"geodesic", "heatmap"};

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

void BM_BindTool(benchmark::State& state, const std::string& asset, const std::string& method) {
  const std::string input = std::string(TESSIK_ASSIMP_MODELS) + "/" + asset;
  struct stat info {};
  if (stat(input.c_str(), &info) != 0) {
    state.SkipWithError(("missing " + input).c_str());
    return;
  }
  char pattern[] = "/tmp/tessik-bind-bench-XXXXXX";
  const char* directory = mkdtemp(pattern);
  if (directory == nullptr) {
    state.SkipWithError("no temporary directory");
    return;
  }
  const std::string output = std::string(directory) + "/out.glb";
  double peak = 0.0;
  for (auto _ : state) {
    const Run run = RunTool({TESSIK_BIND_EXE, input, "--method", method, "-o", output});
    if (!run.ok) {
      state.SkipWithError("tessik-bind failed");
      break;
    }
    state.SetIterationTime(run.seconds);
    if (run.peakRssMiB > peak) peak = run.peakRssMiB;
  }
  std::remove(output.c_str());
  rmdir(directory);
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
  return tessik::bench::runBenchmarks(argc, argv);
}
