#!/usr/bin/env bash
# Builds the example service qnsensord and runs it so a newcomer sees the library work: the
# service starts in the foreground with its log in a temporary directory, is ended with SIGTERM
# after a moment, and its log is shown.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh

cmake -S . -B build/demo -DCMAKE_BUILD_TYPE=Release -DQN_BUILD_TESTS=OFF >/dev/null
cmake --build build/demo -j"$(nproc)" --target qnsensord

logdir=$(mktemp -d)
trap 'rm -rf "$logdir"' EXIT
echo "Starting qnsensord with QN_LOG_DIR=$logdir"
QN_LOG_DIR="$logdir" build/demo/examples/qnsensord -D false &
pid=$!
sleep 2
echo "Sending SIGTERM to $pid"
kill -TERM "$pid"
status=0
wait "$pid" || status=$?
echo "qnsensord exited with status $status"
echo "--- $logdir/qnsensord.log (notices and above) ---"
grep -v -- ' -T- ' "$logdir/qnsensord.log"
exit "$status"
