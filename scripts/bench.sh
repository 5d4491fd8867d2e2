#!/usr/bin/env bash
# Builds the benchmarks in Release and runs every one of them. Extra arguments go to each
# benchmark program (for example --benchmark_filter=Pool).
# Figures are medians of 5 repetitions, the contenders interleaved through the run; logs go to a
# temporary directory.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh bench

cmake -S . -B build/bench -DCMAKE_BUILD_TYPE=Release -DQN_BUILD_TESTS=OFF -DQN_BUILD_BENCH=ON >/dev/null
cmake --build build/bench -j"$(nproc)"

logdir=$(mktemp -d)
trap 'rm -rf "$logdir"' EXIT
export QN_LOG_DIR="$logdir"
echo "machine: $(nproc) cores, $(grep -m1 'model name' /proc/cpuinfo | cut -d: -f2 | sed 's/^ //')"
echo "compiler: $(g++ --version | head -n1); flags: -O3 -DNDEBUG (CMake Release)"
for bench in build/bench/bench/*Bench; do
  [ -x "$bench" ] || continue
  echo "=== $(basename "$bench") ==="
  "$bench" --benchmark_repetitions=5 --benchmark_enable_random_interleaving=true \
    --benchmark_report_aggregates_only=true "$@"
done
