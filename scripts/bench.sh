#!/usr/bin/env bash
# Builds the benchmarks and the example service in Release (-Werror), runs every benchmark program
# with its contenders interleaved (Google Benchmark's random interleaving over ROUNDS repetitions,
# a second thread started before measuring), measures the whole service (bench/service.py: readings/s
# and round trips under qnsensor-feed, and the start-up time), and regenerates docs/BENCHMARKS.md
# from that one run with scripts/bench-report.py. The prose of docs/benchmarks-notes.md is appended.
#
#   scripts/bench.sh [benchmark arguments...]
#
# Extra arguments go to every benchmark program (for a trial, e.g. --benchmark_filter=Logger).
# A benchmark without its own MinTime or Iterations runs each repetition for about 0.1 s.
# Environment: ROUNDS (default 9), SERVICE_READINGS (readings per feed run, default 5000),
# BENCH_OUT (the file to write, default docs/BENCHMARKS.md), SKIP_SERVICE=1 to leave the service out,
# RESULTS_DIR (keep the run's JSON files there; after editing docs/benchmarks-notes.md, rerun only
# scripts/bench-report.py on them, with the command the run printed).
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh bench

rounds=${ROUNDS:-9}
out=${BENCH_OUT:-docs/BENCHMARKS.md}
build=build/bench
cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DQN_WERROR=ON -DQN_BUILD_TESTS=OFF -DQN_BUILD_BENCH=ON \
  -DQN_BUILD_EXAMPLES=ON >/dev/null
cmake --build "$build" -j"$(nproc)"

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
results=${RESULTS_DIR:-$work/results}
mkdir -p "$results" "$work/logs"
export QN_LOG_DIR="$work/logs"

start_all=$(date +%s)
for bench in "$build"/bench/*Bench; do
  [ -x "$bench" ] || continue
  name=$(basename "$bench")
  echo "=== $name"
  start=$(date +%s)
  "$bench" --benchmark_repetitions="$rounds" --benchmark_enable_random_interleaving=true \
    --benchmark_min_time=0.1 --benchmark_display_aggregates_only=true \
    --benchmark_out="$results/$name.json" --benchmark_out_format=json "$@"
  echo "=== $name: $(($(date +%s) - start)) s"
  rm -rf "${QN_LOG_DIR:?}"/*
done
if [ "${SKIP_SERVICE:-0}" != 1 ]; then
  echo "=== service"
  start=$(date +%s)
  python3 bench/service.py --build "$build" --out "$results/Service.json" --rounds "$rounds" \
    --readings "${SERVICE_READINGS:-5000}"
  echo "=== service: $(($(date +%s) - start)) s"
fi
echo "=== all: $(($(date +%s) - start_all)) s"
cp /proc/loadavg "$results/loadavg"  # how busy the machine was, for the report

command="scripts/bench.sh"
[ $# -eq 0 ] || command+=" $*"
[ "$rounds" = 9 ] || command="ROUNDS=$rounds $command"
[ -z "${SERVICE_READINGS:-}" ] || command="SERVICE_READINGS=$SERVICE_READINGS $command"
report=(python3 scripts/bench-report.py --results "$results" --build "$build" --notes docs/benchmarks-notes.md
  --out "$out" --command "$command" --rounds "$rounds")
"${report[@]}"
echo "wrote $out"
[ -z "${RESULTS_DIR:-}" ] || echo "regenerate with: $(printf '%q ' "${report[@]}")"
