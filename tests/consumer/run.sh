#!/usr/bin/env bash
# The library used from outside its tree, as its users take it in. Each mode is one CTest test;
# every service it builds is tickd, the minimal service printed in docs/GUIDE.md.
#   install       cmake --install of the build tree into <work>/prefix; checks the installed files
#   package       tickd through find_package(QNSystem 1.0 CONFIG REQUIRED) against that prefix
#   pkg-config    tickd compiled with pkg-config --cflags --libs qnsystem against that prefix
#   subdirectory  tickd in a project that takes the source tree in with add_subdirectory()
#   newcomer      tickd without its instance manager, then without its version: the "-E-" line
#                 names the member before the assertion ends the process with status 1
# Each built tickd runs in the foreground twice, set up by options and by a configuration file:
# it must log its start and a tick, end on SIGTERM with status 0 and the shut-down lines, and log
# nothing at error level. Every wait is bounded.
# Usage: run.sh <mode> <source dir> <build dir> <work dir> <c++ compiler> <c++ flags> <build type>
set -euo pipefail
mode=$1 src=$2 build=$3 work=$4 cxx=$5 flags=$6 type=$7
prefix=$work/prefix
dir=$work/$mode

fail() { echo "FAIL ($mode): $*" >&2; exit 1; }

# waitFor <text> <file> <seconds>
waitFor() {
  for _ in $(seq $(($3 * 10))); do
    grep -qF -- "$1" "$2" 2>/dev/null && return 0
    sleep 0.1
  done
  fail "no '$1' in $2 within $3 s"
}

# expectInOrder <file> <text>...: each text on a later line than the one before.
expectInOrder() {
  local file=$1 last=0 line
  shift
  for text; do
    line=$(grep -nF -- "$text" "$file" | head -1 | cut -d: -f1)
    [ -n "$line" ] && [ "$line" -gt "$last" ] || fail "'$text' missing or out of order in $file"
    last=$line
  done
}

extract() {  # extract <output> [<member to leave out>]
  cmake -DGUIDE="$src/docs/GUIDE.md" -DOUT="$1" ${2:+-DDROP=$2} -P "$src/tests/consumer/ExtractService.cmake"
}

compileWithPkgConfig() {  # compileWithPkgConfig <source> <binary>
  PKG_CONFIG_PATH=$(echo "$prefix"/lib/*/pkgconfig)
  export PKG_CONFIG_PATH
  local libdir
  libdir=$(pkg-config --variable=libdir qnsystem)
  # shellcheck disable=SC2046,SC2086  # flags and pkg-config's answer are lists of words
  "$cxx" $flags -std=c++17 "$1" $(pkg-config --cflags --libs qnsystem) -Wl,-rpath,"$libdir" -o "$2"
}

buildWithCMake() {  # buildWithCMake <QN_CONSUME> <extra cmake arguments>...
  local how=$1
  shift
  extract "$dir/tickd.cpp"
  cmake -S "$src/tests/consumer" -B "$dir/build" -DQN_CONSUME="$how" -DQN_SERVICE_SOURCE="$dir/tickd.cpp" \
    -DCMAKE_CXX_COMPILER="$cxx" -DCMAKE_CXX_FLAGS="$flags" -DCMAKE_BUILD_TYPE="$type" "$@" >"$dir/configure.out" ||
    { cat "$dir/configure.out"; fail "configure"; }
  cmake --build "$dir/build" -j2 >"$dir/build.out" || { tail -50 "$dir/build.out"; fail "build"; }
}

# runOnce <tickd> <log dir> <arguments>...
runOnce() {
  local bin=$1 logs=$2 pid status=0
  shift 2
  rm -rf "$logs" && mkdir -p "$logs"
  QN_LOG_DIR=$logs "$bin" "$@" >"$logs/out" 2>&1 &
  pid=$!
  waitFor "tickd running" "$logs/tickd.log" 30
  waitFor "tick 1" "$logs/tickd.log" 30
  kill -TERM "$pid"
  for _ in $(seq 300); do kill -0 "$pid" 2>/dev/null || break; sleep 0.1; done
  kill -0 "$pid" 2>/dev/null && { kill -KILL "$pid"; fail "still running 30 s after SIGTERM"; }
  wait "$pid" || status=$?
  [ "$status" -eq 0 ] || { cat "$logs/out"; fail "exit status $status after SIGTERM ($*)"; }
  expectInOrder "$logs/tickd.log" "tickd running" "tick 1" "All threads have gracefully exited" \
    "Destroying System" "Destroying the Logger. You won't see any more logs!"
  ! grep -F -- " -E- " "$logs/tickd.log" "$logs/out" || fail "error lines logged ($*)"
}

runService() {  # runService <tickd>
  runOnce "$1" "$dir/options" -D false -b 1 -d 127
  mkdir -p "$dir/conf"
  printf 'DebugLevel = 127\nHbTimeout = 1\nDaemonize = false\n' >"$dir/conf/tickd.conf"
  runOnce "$1" "$dir/file" -c "$dir/conf/tickd.conf"
}

# expectNewcomerLine <member> <arguments>...: tickd built without <member> and run with the
# arguments ends by the assertion, after an error line that names the member.
expectNewcomerLine() {
  local member=$1 status=0
  shift
  extract "$dir/$member.cpp" "$member"
  compileWithPkgConfig "$dir/$member.cpp" "$dir/$member"
  mkdir -p "$dir/$member.logs"
  QN_LOG_DIR=$dir/$member.logs timeout 30 "$dir/$member" "$@" >"$dir/$member.out" 2>&1 || status=$?
  # Before the log file exists the lines reach standard error; afterwards the log.
  cat "$dir/$member.out" "$dir/$member.logs/tickd.log" >"$dir/$member.lines" 2>/dev/null || true
  [ "$status" -eq 1 ] || { cat "$dir/$member.lines"; fail "without $member: exit status $status, not 1"; }
  expectInOrder "$dir/$member.lines" "QNCSystem::$member is not set: create a" "Assertion [ 0 != mPointer ] failed"
  grep -F "QNCSystem::$member is not set" "$dir/$member.lines" | grep -qF " -E- " || fail "$member: not at error level"
}

rm -rf "$dir" && mkdir -p "$dir"
case "$mode" in
  install)
    rm -rf "$prefix"
    cmake --install "$build" --prefix "$prefix" >"$dir/install.out"
    lib=$(echo "$prefix"/lib/*/libQNSystem.so.1)
    for file in "$lib" "$lib".* "${lib%.1}" "$prefix/include/QNSystem/System.h" \
      "$prefix"/lib/*/cmake/QNSystem/QNSystemConfig.cmake "$prefix"/lib/*/cmake/QNSystem/QNSystemConfigVersion.cmake \
      "$prefix"/lib/*/pkgconfig/qnsystem.pc; do
      [ -e "$file" ] || fail "not installed: $file"
    done
    readelf -d "$lib" | grep -qF "Library soname: [libQNSystem.so.1]" || fail "$lib: SONAME is not libQNSystem.so.1"
    # Only the public headers: the logger's internals stay inside the library.
    [ ! -e "$prefix/include/QNSystem/LoggerSink.h" ] || fail "a private header was installed"
    ;;
  package)
    buildWithCMake package -DCMAKE_PREFIX_PATH="$prefix"
    runService "$dir/build/tickd"
    ;;
  pkg-config)
    extract "$dir/tickd.cpp"
    compileWithPkgConfig "$dir/tickd.cpp" "$dir/tickd"
    runService "$dir/tickd"
    ;;
  subdirectory)
    buildWithCMake subdirectory -DQN_SOURCE_TREE="$src"
    runService "$dir/build/tickd"
    ;;
  newcomer)
    expectNewcomerLine mProcessInstanceManager -D false
    expectNewcomerLine mVersion -v
    ;;
  *) fail "unknown mode" ;;
esac
echo "PASS ($mode)"
