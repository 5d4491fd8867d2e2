#!/usr/bin/env bash
# Builds the Debian packages libqnsystem1 (the shared library) and libqnsystem-dev (headers, CMake
# package, pkg-config file) into build/package/. Install them with
#   sudo apt install ./build/package/libqnsystem1_*.deb ./build/package/libqnsystem-dev_*.deb
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh

dir=build/package
cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=Release -DQN_BUILD_TESTS=OFF -DQN_BUILD_EXAMPLES=OFF >/dev/null
cmake --build "$dir" -j"$(nproc)"
(cd "$dir" && cpack -G DEB)
for deb in "$dir"/*.deb; do
  echo "== $deb"
  dpkg-deb -f "$deb" Package Version Depends
done
