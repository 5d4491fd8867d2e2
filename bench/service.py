#!/usr/bin/python3
"""The whole example service measured from outside, as a user runs it.

Every round starts qnsensord in the foreground (-D false) once per log mask, in a fresh log
directory, and
  - times the start-up: from the moment just before the process is spawned (posix_spawn, so the
    figure includes exec and loading the libraries) to the time stamp of its "qnsensord running"
    log line, which the service writes once its sockets listen and every thread runs; the part
    of it from the log's first line (written first thing in main) to "running"; and, read
    from /proc/<pid>/task/*/schedstat as soon as the line is seen, the CPU time its threads used
    by then and the time they spent runnable but waiting for a CPU (what a busy machine adds);
  - runs qnsensor-feed against it with 1, 2 and 8 connections (in an order shuffled per round),
    taking readings/s and the p50 and p99 round trip from the feed's "figures:" line, and the log
    bytes written per reading;
  - stops it with "qnsensord -s" and checks that it exits with status 0.
The masks are taken in alternating order, so both see the same machine state over the run.

Writes the rounds as Google Benchmark JSON (one "iteration" entry per round and case), named
Service/<N>conn_mask<M>/ours (items_per_second = readings/s, counters p50_us, p99_us,
log_bytes_per_item) and Service/startup_mask<M>/ours (real_time in ms, counters main_ms,
cpu_ms and wait_ms), so the report generator
reads them like every other benchmark. Exits non-zero, saying why, if the service fails to
start, the feed reports an error, or the service does not stop cleanly.
"""

import argparse
import datetime
import json
import os
import random
import re
import shutil
import signal
import subprocess
import sys
import tempfile
import time

STAMP = rb"(\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\.\d{6})"
RUNNING_LINE = re.compile(rb"^" + STAMP + rb" -N- .*qnsensord running", re.M)
FIRST_LINE = re.compile(rb"^" + STAMP + rb" ")
FIGURES_LINE = re.compile(r"^figures: readings_per_s=(\S+) p50_us=(\S+) p99_us=(\S+) errors=(\d+)$", re.M)
CONNECTIONS = (1, 2, 8)
MASKS = (127, 255)
CHANNELS = 2


def fail(message):
    sys.exit("service.py: " + message)


def stamp_of(match):
    """The log's local time stamp as seconds since the epoch (this process reads local time too)."""
    return datetime.datetime.strptime(match.group(1).decode(), "%Y-%m-%d %H:%M:%S.%f").timestamp()


def wait_for_running(pid, log_path, timeout_s=10.0):
    """Returns the time stamps of the log's first line (written first thing in main) and of the
    "running" line."""
    deadline = time.monotonic() + timeout_s
    while time.monotonic() < deadline:
        try:
            with open(log_path, "rb") as log:
                text = log.read()
            match = RUNNING_LINE.search(text)
            if match:
                return stamp_of(FIRST_LINE.match(text)), stamp_of(match)
        except FileNotFoundError:
            pass
        done, status = os.waitpid(pid, os.WNOHANG)
        if done:
            fail(f"qnsensord exited with status {status} before it logged 'running' ({log_path})")
        time.sleep(0.001)
    os.kill(pid, signal.SIGKILL)
    os.waitpid(pid, 0)
    fail(f"qnsensord did not log 'running' within {timeout_s} s")


def scheduler_times_ms(pid):
    """CPU time and run-queue wait of all the process's threads so far, in milliseconds."""
    cpu = wait = 0
    for task in os.listdir(f"/proc/{pid}/task"):
        try:
            with open(f"/proc/{pid}/task/{task}/schedstat") as stat:
                fields = stat.read().split()
            cpu += int(fields[0])
            wait += int(fields[1])
        except (FileNotFoundError, ProcessLookupError):
            pass  # a thread that ended meanwhile
    return cpu / 1e6, wait / 1e6


def start_service(build, mask, log_dir):
    env = dict(os.environ, QN_LOG_DIR=log_dir)
    devnull = os.open(os.devnull, os.O_RDWR)
    actions = [(os.POSIX_SPAWN_DUP2, devnull, 0), (os.POSIX_SPAWN_DUP2, devnull, 1),
               (os.POSIX_SPAWN_DUP2, devnull, 2)]
    program = os.path.join(build, "examples", "qnsensord")
    args = [program, "-D", "false", "-d", str(mask), "-n", str(CHANNELS)]
    before = time.time()
    pid = os.posix_spawn(program, args, env, file_actions=actions)
    os.close(devnull)
    first, running = wait_for_running(pid, os.path.join(log_dir, "qnsensord.log"))
    cpu_ms, wait_ms = scheduler_times_ms(pid)
    return pid, {"real_time": (running - before) * 1000.0, "main_ms": (running - first) * 1000.0,
                 "cpu_ms": cpu_ms, "wait_ms": wait_ms}


def stop_service(build, pid, log_dir):
    env = dict(os.environ, QN_LOG_DIR=log_dir)
    subprocess.run([os.path.join(build, "examples", "qnsensord"), "-s"], env=env,
                   stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, check=False, timeout=30)
    _, status = os.waitpid(pid, 0)
    if status != 0:
        fail(f"qnsensord ended with wait status {status} after 'qnsensord -s'")


def feed(build, log_dir, readings, connections):
    result = subprocess.run([os.path.join(build, "examples", "qnsensor-feed"), "-d", log_dir, "-n",
                             str(readings), "-m", str(connections), "-c", str(CHANNELS)],
                            capture_output=True, text=True, timeout=300, check=False)
    match = FIGURES_LINE.search(result.stdout)
    if result.returncode != 0 or not match or int(match.group(4)) != 0:
        fail(f"qnsensor-feed -m {connections} failed (status {result.returncode}):\n"
             f"{result.stdout}{result.stderr}")
    return float(match.group(1)), float(match.group(2)), float(match.group(3))


def entry(name, round_index, **fields):
    run = {"name": name, "run_name": name, "run_type": "iteration", "repetition_index": round_index,
           "threads": 1, "iterations": 1}
    run.update(fields)
    return run


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--build", required=True, help="the CMake build directory (Release)")
    parser.add_argument("--out", required=True, help="the JSON file to write")
    parser.add_argument("--rounds", type=int, default=9)
    parser.add_argument("--readings", type=int, default=5000, help="readings per feed run")
    options = parser.parse_args()

    runs = []
    for round_index in range(options.rounds):
        for mask in MASKS if round_index % 2 == 0 else reversed(MASKS):
            log_dir = tempfile.mkdtemp(prefix="qnsensord-bench.")
            try:
                pid, startup = start_service(options.build, mask, log_dir)
                runs.append(entry(f"Service/startup_mask{mask}/ours", round_index, cpu_time=startup["cpu_ms"],
                                  time_unit="ms", **startup))
                log_path = os.path.join(log_dir, "qnsensord.log")
                for connections in random.sample(CONNECTIONS, len(CONNECTIONS)):
                    size_before = os.path.getsize(log_path)
                    rate, p50, p99 = feed(options.build, log_dir, options.readings, connections)
                    log_bytes = (os.path.getsize(log_path) - size_before) / options.readings
                    runs.append(entry(f"Service/{connections}conn_mask{mask}/ours", round_index,
                                      items_per_second=rate, p50_us=p50, p99_us=p99,
                                      log_bytes_per_item=log_bytes, real_time=1e9 / rate if rate else 0,
                                      cpu_time=0, time_unit="ns"))
                stop_service(options.build, pid, log_dir)
            finally:
                shutil.rmtree(log_dir, ignore_errors=True)
        print(f"service round {round_index + 1}/{options.rounds} done", flush=True)

    context = {"date": datetime.datetime.now().astimezone().isoformat(timespec="seconds"),
               "executable": "bench/service.py", "readings_per_run": options.readings,
               "channels": CHANNELS}
    with open(options.out, "w") as out:
        json.dump({"context": context, "benchmarks": runs}, out, indent=1)


if __name__ == "__main__":
    main()
