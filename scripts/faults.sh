#!/usr/bin/env bash
# Fault injection against qnsensord with libfiu (Debian: libfiu-dev, fiu-utils; installed here
# when missing). Each of fork, open, write, close, socket, bind, accept, poll and pthread_create
# fails, alone, from start-up on and, separately, for 2 s while the service runs under load
# (pthread_create and accept4 through a small preload of our own, libfiu has no failure point for
# them; fork
# only at start-up, as a daemon: the service forks nowhere else).
# Each case must end in one of two ways, never a hang or a crash:
#   "stops"  : the service ends with a message and a non-zero status, no process is left, and
#              the instance lock is free (a new instance starts);
#   "serves" : it keeps serving (a feed run after the fault gets every answer) and stops in order.
# Prints one line per case and exits non-zero when any case does neither.
# Usage: scripts/faults.sh
set -uo pipefail
cd "$(dirname "$0")/.."

if ! command -v fiu-run >/dev/null 2>&1 || [ ! -f /usr/lib/fiu/fiu_posix_preload.so ]; then
  SUDO=""
  [ "$(id -u)" -eq 0 ] || SUDO="sudo"
  $SUDO apt-get update -qq && DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq libfiu-dev fiu-utils
fi
build=build/test-normal
cmake -S . -B "$build" >/dev/null && cmake --build "$build" -j2 --target qnsensord qnsensor-feed >/dev/null || exit 2
service="$PWD/$build/examples/qnsensord"
feed="$PWD/$build/examples/qnsensor-feed"

work=$(mktemp -d /tmp/qnfaults.XXXXXX)
# Calls libfiu has no failure point for: pthread_create, and accept4 (the service's accept; libfiu
# wraps only accept). Each fails while the file named by QN_FAIL_<CALL> exists.
cat >"$work/failthread.c" <<'C'
#define _GNU_SOURCE
#include <dlfcn.h>
#include <errno.h>
#include <pthread.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>
static int failing(const char* name) {
  const char* flag = getenv(name);
  return flag && access(flag, F_OK) == 0;
}
int pthread_create(pthread_t* t, const pthread_attr_t* a, void* (*f)(void*), void* p) {
  static int (*real)(pthread_t*, const pthread_attr_t*, void* (*)(void*), void*);
  if (!real) real = (int (*)(pthread_t*, const pthread_attr_t*, void* (*)(void*), void*))dlsym(RTLD_NEXT, "pthread_create");
  return failing("QN_FAIL_PTHREAD_CREATE") ? EAGAIN : real(t, a, f, p);
}
int accept4(int fd, struct sockaddr* addr, socklen_t* len, int flags) {
  static int (*real)(int, struct sockaddr*, socklen_t*, int);
  if (!real) real = (int (*)(int, struct sockaddr*, socklen_t*, int))dlsym(RTLD_NEXT, "accept4");
  if (failing("QN_FAIL_ACCEPT")) {
    errno = EMFILE;
    return -1;
  }
  return real(fd, addr, len, flags);
}
C
cc -shared -fPIC -O2 -o "$work/failthread.so" "$work/failthread.c" -ldl || exit 2

failures=0
report() { printf '%-15s %-9s %-7s %s\n' "$1" "$2" "$3" "$4"; [ "$3" = "FAILED" ] && failures=$((failures + 1)); }

# Waits up to $2 tenths of a second for process $1 (a child of this shell) to end; sets ended to
# its status, or to "running". Not in a subshell: only this shell can reap its children.
wait_end() {
  ended=running
  for _ in $(seq "$2"); do
    if ! kill -0 "$1" 2>/dev/null; then
      wait "$1"
      ended=$?
      return
    fi
    sleep 0.1
  done
}

# The instance lock is free and no qnsensord of this directory is left.
clean_after() {
  local dir=$1
  pgrep -f "QN_LOG_DIR=$dir" >/dev/null && return 1
  mv "$dir/qnsensord.log" "$dir/first.log"  # the new instance's "running" line must be its own
  QN_LOG_DIR=$dir "$service" -D false -d 57 >"$dir/check.out" 2>&1 &
  local pid=$!
  for _ in $(seq 50); do grep -q "qnsensord running" "$dir/qnsensord.log" 2>/dev/null && break; sleep 0.1; done
  kill -TERM $pid 2>/dev/null
  wait_end $pid 50
  [ "$ended" = 0 ]
}

run_case() {  # name fail-point phase
  local name=$1 point=$2 phase=$3
  local dir="$work/$name-$phase"
  mkdir -p "$dir"
  : >"$dir/qnsensord.log"
  local daemon=false
  [ "$name" = fork ] && daemon=true
  local flag="$dir/fail-threads"
  # fiu-run sets LD_PRELOAD itself, so our own preload goes without it.
  local -a wrap=(env LD_PRELOAD="$work/failthread.so" "QN_FAIL_${name^^}=$flag")
  [ -z "$point" ] || wrap=(fiu-run -x -f "$dir/ctl")
  if [ "$phase" = start-up ]; then
    if [ -z "$point" ]; then touch "$flag"; else wrap+=(-c "enable name=$point"); fi
  fi
  QN_LOG_DIR=$dir "${wrap[@]}" "$service" -D $daemon -d 57 >"$dir/out" 2>"$dir/err" &
  local pid=$!
  for _ in $(seq 50); do
    grep -q "qnsensord running" "$dir/qnsensord.log" 2>/dev/null && break
    kill -0 $pid 2>/dev/null || break
    sleep 0.1
  done
  if [ "$phase" = running ] && kill -0 $pid 2>/dev/null; then
    QN_LOG_DIR=$dir "$feed" -n 200000 -m 2 >/dev/null 2>&1 &
    local load=$!
    sleep 0.5
    if [ -z "$point" ]; then touch "$flag"; else fiu-ctrl -f "$dir/ctl" -c "enable name=$point" $pid; fi
    sleep 2
    if [ -z "$point" ]; then rm -f "$flag"; else fiu-ctrl -f "$dir/ctl" -c "disable name=$point" $pid 2>/dev/null; fi
    kill $load 2>/dev/null; wait $load 2>/dev/null
  fi
  local status
  if [ "$daemon" = true ]; then
    wait_end $pid 100  # the starting process of a daemon
    status=$ended
    local daemon_pid
    daemon_pid=$(pgrep -f "QN_LOG_DIR=$dir" || true)
    [ -z "$daemon_pid" ] || { kill -TERM $daemon_pid; sleep 1; }
  else
    status=running
    wait_end $pid 1
    status=$ended
  fi
  if [ "$status" = running ]; then
    if QN_LOG_DIR=$dir timeout 20 "$feed" -n 2000 -m 2 >"$dir/feed.out" 2>&1; then
      kill -TERM $pid
      wait_end $pid 50
      status=$ended
      if [ "$status" = 0 ]; then report "$name" "$phase" serves "feed answered, stopped in order"; return; fi
      report "$name" "$phase" FAILED "did not stop in order (status $status)"
      kill -9 $pid 2>/dev/null
      return
    fi
    kill -TERM $pid
    wait_end $pid 50
    status=$ended
    [ "$status" = running ] && { kill -9 $pid; report "$name" "$phase" FAILED "hangs: neither serves nor stops"; return; }
  fi
  local message
  # What main printed ("qnsensord: ..."), else the last error or halt line (not the note that no
  # configuration file is read; the log goes to standard error until the log file is open).
  message=$(grep -h '^qnsensord:' "$dir/err" | tail -1)
  [ -n "$message" ] || message=$(grep -h -E -- " -[EH]- " "$dir/err" "$dir/qnsensord.log" 2>/dev/null |
    grep -v "Config file parsing" | tail -1 | sed 's/^.*) //')
  message=$(echo "$message" | cut -c1-120)
  if [ "$status" -ge 128 ] 2>/dev/null; then
    report "$name" "$phase" FAILED "crashed (status $status): $message"
  elif [ "$status" = 0 ] || [ -z "$message" ]; then
    report "$name" "$phase" FAILED "stopped without saying why (status $status)"
  elif ! clean_after "$dir"; then
    report "$name" "$phase" FAILED "left a process or the lock behind (status $status)"
  else
    report "$name" "$phase" stops "status $status: $message"
  fi
}

printf '%-15s %-9s %-7s %s\n' call phase outcome detail
run_case fork posix/proc/fork start-up
for name in open write close socket bind accept poll pthread_create; do
  case $name in
    open | close) point=posix/io/oc/$name ;;
    write) point=posix/io/rw/write ;;
    socket | bind) point=posix/io/net/$name ;;
    accept) point="" ;;  # accept4, by our preload
    poll) point=posix/io/net/poll ;;
    pthread_create) point="" ;;
  esac
  run_case $name "$point" start-up
  run_case $name "$point" running
done
[ $failures -eq 0 ] && rm -rf "$work" || echo "logs in $work"
exit $((failures > 0))
