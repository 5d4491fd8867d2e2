#!/usr/bin/env bash
# Installs, from Debian's packages, whatever the build, the tests and the benchmarks need and the
# machine lacks. Safe to run again: it installs nothing when everything is there.
# With the argument "bench" it also installs the libraries the benchmarks measure us against.
set -euo pipefail

missing=()
command -v cmake >/dev/null 2>&1 || missing+=(cmake)
command -v g++ >/dev/null 2>&1 || missing+=(g++)
command -v make >/dev/null 2>&1 || missing+=(make)
command -v clang-format >/dev/null 2>&1 || missing+=(clang-format)
[ -f /usr/include/gtest/gtest.h ] || missing+=(libgtest-dev)
[ -f /usr/include/gmock/gmock.h ] || missing+=(libgmock-dev)
[ -f /usr/include/benchmark/benchmark.h ] || missing+=(libbenchmark-dev)
# The consumer tests and the Debian packages (tests/consumer/, scripts/package.sh).
command -v pkg-config >/dev/null 2>&1 || missing+=(pkgconf)
command -v readelf >/dev/null 2>&1 || missing+=(binutils)
command -v dpkg-shlibdeps >/dev/null 2>&1 || missing+=(dpkg-dev)
if [ "${1:-}" = bench ]; then
  [ -f /usr/include/spdlog/spdlog.h ] || missing+=(libspdlog-dev)
  [ -f /usr/include/concurrentqueue/blockingconcurrentqueue.h ] || missing+=(libconcurrentqueue-dev)
  command -v python3 >/dev/null 2>&1 || missing+=(python3)
fi

if [ ${#missing[@]} -gt 0 ]; then
  echo "Installing: ${missing[*]}"
  SUDO=""
  [ "$(id -u)" -eq 0 ] || SUDO="sudo"
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq "${missing[@]}"
fi
