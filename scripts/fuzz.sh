#!/usr/bin/env bash
# Builds the libFuzzer targets with clang (ASan + UBSan, the library instrumented for coverage) in
# build/fuzz and runs each for a number of seconds, one after the other, over its stored corpus.
# Usage: scripts/fuzz.sh [seconds per target, default 60] [target name ...]
#   e.g. scripts/fuzz.sh 300 ProtocolHelper
# New interesting inputs go to build/fuzz/corpus/<target>/ (the stored corpus under fuzz/corpus/
# is only read); crashes, leaks, time-outs and out-of-memory inputs go to
# build/fuzz/artifacts/<target>/. Exits non-zero when any target found a fault.
set -euo pipefail
cd "$(dirname "$0")/.."

seconds=${1:-60}
shift || true
targets=("$@")
if [ ${#targets[@]} -eq 0 ]; then
  for source in fuzz/*Fuzz.cpp; do
    name=$(basename "$source" .cpp)
    targets+=("${name%Fuzz}")
  done
fi

dir=build/fuzz
cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_CXX_COMPILER=clang++ \
  -DQN_BUILD_FUZZ=ON -DQN_BUILD_TESTS=OFF >/dev/null
build_targets=()
for target in "${targets[@]}"; do build_targets+=("${target}Fuzz"); done
cmake --build "$dir" -j2 --target "${build_targets[@]}"

failed=0
for target in "${targets[@]}"; do
  corpus="$dir/corpus/$target"
  artifacts="$dir/artifacts/$target"
  mkdir -p "$corpus" "$artifacts"
  echo "=== $target: ${seconds}s ==="
  # One process at a time (the machine is shared). -timeout: an input running for 10 s is a hang.
  # -rss_limit_mb: a hostile length that makes the library allocate gigabytes is reported as oom.
  status=0
  "$dir/fuzz/${target}Fuzz" "$corpus" "fuzz/corpus/$target" \
    -max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 -max_len=4096 \
    -artifact_prefix="$artifacts/" -print_final_stats=1 >"$dir/$target.log" 2>&1 || status=$?
  grep -E '^(stat::number_of_executed_units|stat::peak_rss_mb|#[0-9]+[[:space:]]+DONE)' "$dir/$target.log" || true
  echo "corpus: $(find "$corpus" -type f | wc -l) new inputs in $corpus"
  found=$(find "$artifacts" -type f | sort)
  if [ $status -ne 0 ] || [ -n "$found" ]; then
    failed=1
    echo "FOUND (exit status $status); log: $dir/$target.log"
    [ -z "$found" ] || echo "$found"
    grep -E -m5 'ERROR: |SUMMARY: |Fuzz property broken' "$dir/$target.log" || true
  else
    echo "nothing found"
  fi
done
exit $failed
