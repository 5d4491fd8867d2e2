#!/usr/bin/env bash
# Builds the example sensor service and its client (Release) and shows them at work:
#   1. qnsensord starts in the foreground with a temporary log directory and a production log
#      mask (127: every level but trace);
#   2. qnsensor-feed sends readings over two connections (a few malformed ones among them, and one
#      client that leaves in the middle of a message) and checks every answer;
#   3. "qnsensord -s" stops the service through its PID file;
#   4. the client's figures and an excerpt of the service's log are printed.
# Exits non-zero if anything along the way failed. READINGS=<n> changes the number of readings.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh

build=build/demo
cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DQN_BUILD_TESTS=OFF >/dev/null
cmake --build "$build" -j"$(nproc)" --target qnsensord qnsensor-feed

logdir=$(mktemp -d)
service_pid=""
cleanup() {
  if [ -n "$service_pid" ] && kill -0 "$service_pid" 2>/dev/null; then kill -KILL "$service_pid"; fi
  rm -rf "$logdir"
}
trap cleanup EXIT
export QN_LOG_DIR="$logdir"
log="$logdir/qnsensord.log"

echo "== Starting qnsensord -D false -d 127 (log mask 127: every level but trace) in $logdir"
"$build/examples/qnsensord" -D false -d 127 &
service_pid=$!
for _ in $(seq 1 100); do
  grep -q "qnsensord running" "$log" 2>/dev/null && break
  kill -0 "$service_pid" 2>/dev/null || { echo "qnsensord did not start"; cat "$log" 2>/dev/null; exit 1; }
  sleep 0.1
done
grep -q "qnsensord running" "$log" || { echo "qnsensord did not report running"; exit 1; }

readings=${READINGS:-100000}
echo "== qnsensor-feed -n $readings -m 2 -e 10 -x"
feed_status=0
"$build/examples/qnsensor-feed" -n "$readings" -m 2 -e 10 -x || feed_status=$?

echo "== qnsensord -s"
"$build/examples/qnsensord" -s
service_status=0
wait "$service_pid" || service_status=$?
service_pid=""
echo "qnsensord exited with status $service_status"

echo "== Excerpt of $log"
echo "-- start-up"
grep -E -- ' -N- ' "$log" | grep -E 'HostName|IpAddress|listening|Started|running' || true
echo "-- malformed and broken messages"
grep -E -- ' -W- ' "$log" | head -n 4 || true
echo "-- statistics and shut-down"
grep -E -- 'Statistics|Sensor |All threads have gracefully exited|Destroying' "$log" | head -n 20 || true

if [ "$feed_status" -ne 0 ] || [ "$service_status" -ne 0 ]; then
  echo "demo FAILED: qnsensor-feed status $feed_status, qnsensord status $service_status"
  exit 1
fi
echo "demo OK"
