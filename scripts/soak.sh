#!/usr/bin/env bash
# Soak: qnsensord under qnsensor-feed for a given time, with clients that disconnect, reset and
# misbehave. Prints readings/s per feed round, the service's resident memory after the first
# minute and at the end (they must stay within 10%), and the time from SIGTERM to exit.
# Not part of CI. Usage: scripts/soak.sh [seconds, default 600]
set -euo pipefail
cd "$(dirname "$0")/.."

seconds=${1:-600}
build=build/test-normal
cmake -S . -B "$build" >/dev/null
cmake --build "$build" -j2 --target qnsensord qnsensor-feed >/dev/null

dir=$(mktemp -d /tmp/qnsoak.XXXXXX)
export QN_LOG_DIR=$dir
"$build/examples/qnsensord" -D false -d 57 -n 4 -t 5 >"$dir/out" 2>&1 &
service=$!
trap 'kill -9 $service 2>/dev/null || true' EXIT
for _ in $(seq 100); do grep -q "qnsensord running" "$dir/qnsensord.log" 2>/dev/null && break; sleep 0.1; done

# One hostile client on a random channel: resets with its answer unread, stays silent, stalls
# inside a message, sends garbage or a huge length, or sends readings without reading answers.
hostile() {
  python3 - "$dir/qnsensord.$((RANDOM % 4)).sock" "$((RANDOM % 5))" <<'PY'
import socket, struct, sys, time
s = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
try:
    s.connect(sys.argv[1])
    kind = int(sys.argv[2])
    frame = lambda b: struct.pack("=I", len(b)) + b
    if kind == 0:   # reset: a reading, then close with its answer unread
        s.sendall(frame(b"reset 1 1.0")); time.sleep(0.2)
    elif kind == 1: # silent
        time.sleep(1.0)
    elif kind == 2: # stalls inside a message
        s.sendall(struct.pack("=I", 100) + b"stall"); time.sleep(1.0)
    elif kind == 3: # garbage and a huge length
        s.sendall(b"\xff\xff\xff\x7fgarbage")
    else:           # deaf: many readings, no answer read
        s.sendall(b"".join(frame(b"deaf %d 1" % i) for i in range(2000)))
except OSError:
    pass
s.close()
PY
}

start=$(date +%s)
rss_first=""
round=0
while [ $(( $(date +%s) - start )) -lt "$seconds" ]; do
  round=$((round + 1))
  hostile &
  peer=$!
  # A feed round: its connections end when it ends (a client disconnect every round).
  rate=$("$build/examples/qnsensor-feed" -n 4000 -m 3 -c 4 -e 10 2>&1 | sed -n 's/.*rate: \([0-9]*\) readings.*/\1/p')
  wait $peer
  elapsed=$(( $(date +%s) - start ))
  rss=$(awk '/VmRSS/ {print $2}' "/proc/$service/status")
  echo "t=${elapsed}s round $round: ${rate:-FAILED} readings/s, RSS ${rss} kB"
  if [ -z "$rss_first" ] && [ "$elapsed" -ge 60 ]; then rss_first=$rss; echo "RSS after the first minute: ${rss_first} kB"; fi
done
rss_end=$(awk '/VmRSS/ {print $2}' "/proc/$service/status")
[ -n "$rss_first" ] || rss_first=$rss_end
echo "RSS at the end: ${rss_end} kB (first minute: ${rss_first} kB)"

# Shut-down under load: SIGTERM while a feed runs.
"$build/examples/qnsensor-feed" -n 200000 -m 3 -c 4 >/dev/null 2>&1 &
feed=$!
sleep 1
t0=$(date +%s%N)
kill -TERM $service
wait $service && status=0 || status=$?
t1=$(date +%s%N)
kill $feed 2>/dev/null || true
wait $feed 2>/dev/null || true
echo "SIGTERM to exit under load: $(( (t1 - t0) / 1000000 )) ms, exit status $status"
trap - EXIT
ok=$(awk -v a="$rss_first" -v b="$rss_end" 'BEGIN { d = b - a; if (d < 0) d = -d; print (d <= a * 0.10) ? 1 : 0 }')
if [ "$ok" = 1 ] && [ "$status" = 0 ]; then echo "soak: PASS"; rm -rf "$dir"; else echo "soak: FAIL (log in $dir)"; exit 1; fi
