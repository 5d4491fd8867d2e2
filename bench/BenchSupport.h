#pragma once
// Shared set-up of the benchmark programs.

namespace qnbench {

// Starts one idle thread that lives until the process ends. glibc and libstdc++ skip atomic
// instructions and locking until a process has a second thread, which would flatter every
// figure; every benchmark program calls this before it measures.
void startSecondThread();

// Masks trace logging off (the log code without 128) or restores the default mask (255).
void setTraceLogging(bool aOn);

}  // namespace qnbench

// main() for a benchmark program: starts the second thread, then runs the registered benchmarks.
#define QN_BENCHMARK_MAIN()                                             \
  int main(int argc, char** argv) {                                     \
    qnbench::startSecondThread();                                       \
    ::benchmark::Initialize(&argc, argv);                               \
    if (::benchmark::ReportUnrecognizedArguments(argc, argv)) return 1; \
    ::benchmark::RunSpecifiedBenchmarks();                              \
    ::benchmark::Shutdown();                                            \
    return 0;                                                           \
  }
