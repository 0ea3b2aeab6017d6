#pragma once

#include <benchmark/benchmark.h>

namespace tessik::bench {

/// Runs the benchmarks registered so far with the command-line filters; 1 for an unknown argument.
/// The benchmarks here register at run time (sizes and iteration counts per case), so each main() calls
/// this instead of BENCHMARK_MAIN and then frees what must go before static destruction.
inline int runBenchmarks(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}

}  // namespace tessik::bench
