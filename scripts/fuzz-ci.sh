#!/usr/bin/env bash
# CI's short fuzzing pass: every libFuzzer target for a few seconds each (default 15) over its
# stored corpus, through scripts/fuzz.sh (same build, same limits, same report). Installs clang
# and the libFuzzer runtime from Debian when the machine lacks them. Exits non-zero when a target
# found a fault (the input is kept under build/fuzz/artifacts/<target>/).
# Usage: scripts/fuzz-ci.sh [seconds per target]
set -euo pipefail
cd "$(dirname "$0")/.."

probe=$(mktemp -d)
trap 'rm -rf "$probe"' EXIT
echo 'extern "C" int LLVMFuzzerTestOneInput(const unsigned char*, unsigned long) { return 0; }' >"$probe/p.cpp"
if ! command -v clang++ >/dev/null 2>&1 || ! clang++ -fsanitize=fuzzer "$probe/p.cpp" -o "$probe/p" 2>/dev/null; then
  SUDO=""
  [ "$(id -u)" -eq 0 ] || SUDO="sudo"
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq clang libclang-rt-dev
fi

exec scripts/fuzz.sh "${1:-15}"
