#!/usr/bin/env bash
# Builds the library and runs every test through CTest three times: a normal build, an
# AddressSanitizer+UndefinedBehaviorSanitizer build and a ThreadSanitizer build.
# Exits non-zero when any build or test fails. Usage: scripts/test.sh [normal|asan|tsan ...]
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh

jobs=$(nproc)
configs=("$@")
[ ${#configs[@]} -gt 0 ] || configs=(normal asan tsan)

for config in "${configs[@]}"; do
  case "$config" in
    normal) flags="" ;;
    asan) flags="-fsanitize=address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer" ;;
    tsan) flags="-fsanitize=thread -fno-omit-frame-pointer" ;;
    *) echo "unknown build '$config'" >&2; exit 2 ;;
  esac
  dir="build/test-$config"
  echo "=== $config build ==="
  cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_CXX_FLAGS="$flags" >/dev/null
  cmake --build "$dir" -j"$jobs"
  echo "=== $config tests ==="
  # setarch -R: ThreadSanitizer needs the address layout it knows; newer kernels randomise wider.
  ASAN_OPTIONS=detect_leaks=1:abort_on_error=0 \
  UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
  TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1 \
    setarch "$(uname -m)" -R ctest --test-dir "$dir" --output-on-failure -j"$jobs" --timeout 300
done
