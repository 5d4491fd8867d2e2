#!/usr/bin/python3
"""Writes docs/BENCHMARKS.md from one run of scripts/bench.sh.

Reads every *.json in the results directory (Google Benchmark's JSON output, one file per
program, and bench/service.py's file in the same format), pairs the contenders by name and writes
one table per area with the medians over the rounds, the ratios and the targets below. The
hand-written notes file is appended unchanged, so prose survives every regeneration.

Names: <Area>/<Case>/<Contender>, optionally followed by the suffixes Google Benchmark appends
(/threads:N, /real_time, /manual_time, /iterations:N, ...), which are dropped. Areas with tables:
Logger, HandOff, Pool, Framing, Service. Anything else goes into the "Other benchmarks" table.
A contender's figure is its median items_per_second over the rounds; a benchmark without
items_per_second is shown as time per iteration (lower is better). The ratio of ours to a
contender is taken round by round (the same repetition index) and its median is shown with the
min-max over the rounds; above 1 favours ours.
"""

import argparse
import datetime
import glob
import json
import os
import platform
import re
import statistics
import subprocess
from collections import OrderedDict, defaultdict

AREAS = ("Logger", "HandOff", "Pool", "Framing", "Service")
# The contender whose ratios each area's table shows; the first one present is taken.
PRIMARY = {"HandOff": ("ours_exit", "ours"), "default": ("ours",)}
CONTENDER_ORDER = ("ours", "ours_exit", "ours_parts", "floor", "spdlog_sync", "spdlog_async",
                   "std_queue", "moodycamel", "malloc", "raw")
SUFFIX = re.compile(r"^(threads|iterations|repeats|min_time|min_warmup_time):.*$"
                    r"|^(real_time|manual_time|process_time)$")

# The targets. Each is checked on the medians of the per-round ratios.
#   ratio: primary / contender >= minimum, at every listed case (None: every case of the area)
#   ratio_or_floor: primary / contender >= minimum, or, where a floor exists, primary / floor >= floor_minimum
#   cross_case: the primary at case_a / the primary at case_b >= minimum
#   startup: the Service start-up median below maximum milliseconds
TARGETS = [
    {"area": "Logger", "kind": "ratio", "cases": ("1thread", "2threads"), "contender": "spdlog_sync",
     "minimum": 1.5},
    {"area": "Logger", "kind": "ratio", "cases": ("1thread", "2threads"), "contender": "spdlog_async",
     "minimum": 1.5},
    {"area": "Logger", "kind": "cross_case", "case_a": "2threads", "case_b": "1thread", "minimum": 0.8},
    {"area": "HandOff", "kind": "ratio_or_floor", "cases": ("stream1to1", "stream2to2"),
     "contender": "std_queue", "minimum": 0.8, "floor_minimum": 1 / 1.1},
    {"area": "Pool", "kind": "ratio", "cases": ("256B", "4KiB"), "contender": "floor", "minimum": 1 / 1.1},
    {"area": "Framing", "kind": "ratio", "cases": None, "contender": "floor", "minimum": 0.9},  # every size
    {"area": "Service", "kind": "startup", "maximum_ms": 10.0},
]
TIME_UNITS = {"ns": 1e-9, "us": 1e-6, "ms": 1e-3, "s": 1.0}


class Series:
    """One contender in one case: its figure per round."""

    def __init__(self):
        self.rounds = {}  # repetition index -> value
        self.higher_is_better = True
        self.counters = defaultdict(dict)  # counter name -> {round: value}

    def median(self):
        return statistics.median(self.rounds.values())

    def spread(self):
        return min(self.rounds.values()), max(self.rounds.values())

    def counter_median(self, name):
        values = self.counters.get(name)
        return statistics.median(values.values()) if values else None


def split_name(name):
    parts = [part for part in name.split("/") if not SUFFIX.match(part)]
    if len(parts) == 3 and parts[0] in AREAS and all(parts):
        return tuple(parts)
    return None


def load(results_dir):
    """Returns ({area: {case: {contender: Series}}}, {name: Series} of unknown names, contexts)."""
    areas = defaultdict(lambda: defaultdict(dict))
    other = OrderedDict()
    contexts = {}
    for path in sorted(glob.glob(os.path.join(results_dir, "*.json"))):
        if os.path.getsize(path) == 0:
            continue  # a program whose benchmarks the filter left out
        with open(path) as source:
            data = json.load(source)
        program = os.path.basename(path)[:-5]
        contexts[program] = data.get("context", {})
        runs = [run for run in data.get("benchmarks", []) if not run.get("error_occurred")]
        # Per repetition where the program wrote them; a program run with aggregates only
        # contributes its median as a single round.
        repeated = {run.get("run_name") or run["name"] for run in runs
                    if run.get("run_type", "iteration") == "iteration"}
        next_round = defaultdict(int)
        for run in runs:
            name = run.get("run_name") or run["name"]
            if run.get("run_type", "iteration") != "iteration" and (
                    name in repeated or run.get("aggregate_name") != "median"):
                continue
            key = split_name(name)
            if key:
                series = areas[key[0]][key[1]].setdefault(key[2], Series())
            else:
                series = other.setdefault(program + ": " + name, Series())
            index = run.get("repetition_index", next_round[name])
            next_round[name] = index + 1
            if "items_per_second" in run:
                series.rounds[index] = float(run["items_per_second"])
            else:
                series.higher_is_better = False
                series.rounds[index] = float(run["real_time"]) * TIME_UNITS.get(run.get("time_unit", "ns"), 1e-9)
            for counter in ("p50_us", "p99_us", "log_bytes_per_item", "main_ms", "cpu_ms", "wait_ms"):
                if counter in run:
                    series.counters[counter][index] = float(run[counter])
    return areas, other, contexts


def ratio(ours, other):
    """Median and (min, max) of ours/other per round (inverted for times), or None."""
    rounds = sorted(set(ours.rounds) & set(other.rounds))
    if not rounds or ours.higher_is_better != other.higher_is_better:
        return None  # a rate against a time has no ratio
    values = []
    for index in rounds:
        a, b = ours.rounds[index], other.rounds[index]
        if a <= 0 or b <= 0:
            continue
        values.append(a / b if ours.higher_is_better else b / a)
    if not values:
        return None
    return statistics.median(values), min(values), max(values)


def si(value):
    for factor, prefix in ((1e9, " G"), (1e6, " M"), (1e3, " k")):
        if value >= factor:
            return f"{value / factor:.3g}{prefix}"
    return f"{value:.3g} "


def duration(seconds):
    for factor, unit in ((1.0, "s"), (1e-3, "ms"), (1e-6, "us")):
        if seconds >= factor:
            return f"{seconds / factor:.3g} {unit}"
    return f"{seconds / 1e-9:.3g} ns"


def figure(series, value=None):
    value = series.median() if value is None else value
    return si(value) + "/s" if series.higher_is_better else duration(value)


def spread_text(series):
    low, high = series.spread()
    return f"{figure(series, low)} - {figure(series, high)}"


def ratio_text(result):
    if result is None:
        return "", ""
    median, low, high = result
    return f"{median:.2f}", f"{low:.2f} - {high:.2f}"


def contender_key(name):
    return (CONTENDER_ORDER.index(name) if name in CONTENDER_ORDER else len(CONTENDER_ORDER), name)


def primary_of(area, contenders):
    for name in PRIMARY.get(area, PRIMARY["default"]):
        if name in contenders:
            return name
    return None


def measured(result):
    return "not measured" if result is None else f"{result[0]:.2f} ({result[1]:.2f} - {result[2]:.2f})"


def check_targets(areas):
    """Returns {(area, case, contender): (target text, met, ratio)} for the table rows, and the
    summary rows (area, what, target text, measured text, met; met None when not measured)."""
    marks = {}
    summary = []
    for target in TARGETS:
        area = areas.get(target["area"], {})
        kind = target["kind"]
        if kind == "startup":
            continue  # the Service table checks it
        if kind == "cross_case":
            a, b = area.get(target["case_a"], {}), area.get(target["case_b"], {})
            name_a, name_b = primary_of(target["area"], a), primary_of(target["area"], b)
            text = f">= {target['minimum']:.2f} x {target['case_b']}"
            result = ratio(a[name_a], b[name_b]) if name_a and name_b else None
            met = None if result is None else result[0] >= target["minimum"]
            marks[(target["area"], target["case_a"], "@" + target["case_b"])] = (text, met, result)
            summary.append((target["area"], f"{name_a or 'ours'} at {target['case_a']} / at {target['case_b']}",
                            text, measured(result), met))
            continue
        # Without a list: every case that has the contender (a case without a floor has no floor target).
        cases = target["cases"] or sorted((case for case in area if target["contender"] in area[case]),
                                          key=case_key)
        if not cases:
            summary.append((target["area"], f"every case: ours / {target['contender']}",
                            f">= {target['minimum']:.2f}", measured(None), None))
        for case in cases:
            contenders = area.get(case, {})
            name = primary_of(target["area"], contenders)
            other = contenders.get(target["contender"])
            result = ratio(contenders[name], other) if name and other else None
            met = None if result is None else result[0] >= target["minimum"]
            text = f">= {target['minimum']:.2f}"
            what = f"{case}: {name or 'ours'} / {target['contender']}"
            shown = measured(result)
            if kind == "ratio_or_floor":
                floor = contenders.get("floor")
                floor_result = ratio(contenders[name], floor) if name and floor else None
                text += f", or >= {target['floor_minimum']:.2f} x floor"
                if floor_result is not None:
                    floor_met = floor_result[0] >= target["floor_minimum"]
                    met = floor_met or bool(met)
                    floor_text = f">= {target['floor_minimum']:.2f}, or the {target['contender']} target"
                    marks[(target["area"], case, "floor")] = (floor_text, met, floor_result)
                    what += " (or / floor)"
                    shown += f"; / floor {measured(floor_result)}"
            marks[(target["area"], case, target["contender"])] = (text, met, result)
            summary.append((target["area"], what, text, shown, met))
    return marks, summary


def yes_no(met):
    return "-" if met is None else ("yes" if met else "**no**")


def area_table(area, cases, marks):
    lines = ["| Case | Contender | Median | Min - max | Ours / contender | Min - max | Target | Met |",
             "| --- | --- | --- | --- | --- | --- | --- | --- |"]
    for case in sorted(cases, key=case_key):
        contenders = cases[case]
        primary = primary_of(area, contenders)
        for name in sorted(contenders, key=contender_key):
            series = contenders[name]
            shown = "" if name == primary or primary is None else ratio(contenders[primary], series)
            median, span = ratio_text(shown) if shown != "" else ("", "")
            target, met = "", ""
            if (area, case, name) in marks:
                target, met_flag, _ = marks[(area, case, name)]
                met = yes_no(met_flag)
            label = f"**{name}**" if name == primary else name
            lines.append(f"| {case} | {label} | {figure(series)} | {spread_text(series)} | {median} | {span} | "
                         f"{target} | {met} |")
        for (mark_area, mark_case, mark_name), (target, met_flag, result) in marks.items():
            if mark_area == area and mark_case == case and mark_name.startswith("@"):
                other = cases.get(mark_name[1:], {})
                other_primary = primary_of(area, other)
                median, span = ratio_text(result)
                lines.append(f"| {case} | {other_primary} at {mark_name[1:]} | "
                             f"{figure(other[other_primary]) if other_primary else ''} | "
                             f"{spread_text(other[other_primary]) if other_primary else ''} | {median} | {span} | "
                             f"{target} | {yes_no(met_flag)} |")
    return lines


def case_key(case):
    """Sorts cases by their leading number and unit (64B < 1KiB < 4KiB), then by name."""
    match = re.match(r"^(\d+)(B|KiB|MiB)?", case)
    if not match:
        return (1, 0, case)
    scale = {"B": 1, "KiB": 1024, "MiB": 1 << 20, None: 1}[match.group(2)]
    return (0, int(match.group(1)) * scale, case)


def service_table(cases):
    """Readings/s and round trips per connection count and mask, and the start-up time."""
    lines = []
    loads = defaultdict(dict)  # connections -> {mask: Series}
    startups = {}
    for case, contenders in cases.items():
        series = contenders.get("ours")
        if series is None:
            continue
        load_match = re.match(r"^(\d+)conn_mask(\d+)$", case)
        startup_match = re.match(r"^startup_mask(\d+)$", case)
        if load_match:
            loads[int(load_match.group(1))][int(load_match.group(2))] = series
        elif startup_match:
            startups[int(startup_match.group(1))] = series
    summary = []
    if loads:
        lines += ["| Connections | Log mask | Readings/s | Min - max | p50 round trip | p99 round trip | "
                  "Log bytes per reading | Rate at 255 / at 127 | Min - max |",
                  "| --- | --- | --- | --- | --- | --- | --- | --- | --- |"]
        for connections in sorted(loads):
            for mask in sorted(loads[connections]):
                series = loads[connections][mask]
                cost, span = "", ""
                if mask == 255 and 127 in loads[connections]:
                    cost, span = ratio_text(ratio(series, loads[connections][127]))
                p50, p99 = series.counter_median("p50_us"), series.counter_median("p99_us")
                log_bytes = series.counter_median("log_bytes_per_item")
                lines.append(f"| {connections} | {mask} | {si(series.median())}/s | {spread_text(series)} | "
                             f"{p50:.0f} us | {p99:.0f} us | {log_bytes:.0f} | {cost} | {span} |"
                             if p50 is not None and p99 is not None and log_bytes is not None else
                             f"| {connections} | {mask} | {si(series.median())}/s | {spread_text(series)} | | | "
                             f"| {cost} | {span} |")
    target = next((t for t in TARGETS if t["kind"] == "startup"), None)
    if startups:
        lines += ["", "| Start-up, exec to the \"running\" log line | Log mask | Median | Min - max | From main() | "
                  "CPU used (all threads) | Waiting for a CPU (all threads) | Target | Met |",
                  "| --- | --- | --- | --- | --- | --- | --- | --- | --- |"]
        for mask in sorted(startups):
            series = startups[mask]
            met = series.median() * 1000 < target["maximum_ms"] if target else None
            text = f"< {target['maximum_ms']:.0f} ms" if target else ""
            parts = " | ".join("" if value is None else f"{value:.1f} ms" for value in
                               (series.counter_median(name) for name in ("main_ms", "cpu_ms", "wait_ms")))
            lines.append(f"| foreground (-D false), {len(series.rounds)} starts | {mask} | {figure(series)} | "
                         f"{spread_text(series)} | {parts} | {text} | {yes_no(met)} |")
            summary.append(("Service", f"start-up at mask {mask}", text, figure(series), met))
    costs = []
    for connections in sorted(loads):
        with_trace, without = loads[connections].get(255), loads[connections].get(127)
        result = ratio(with_trace, without) if with_trace and without else None
        if result:
            p50 = [series.counter_median("p50_us") for series in (with_trace, without)]
            slower = f", p50 round trip {p50[0] / p50[1]:.2f}x as long" if None not in p50 and p50[1] > 0 else ""
            costs.append(f"{connections} connection{'s' if connections > 1 else ''}: {result[0]:.2f}x the "
                         f"readings/s{slower}")
    if costs:
        lines += ["", "What trace logging costs a user: the service at mask 255 (every level) against mask 127 "
                  "(every level but trace), medians over the rounds; " + "; ".join(costs) + "."]
    return lines, summary


def run_quiet(command):
    try:
        return subprocess.run(command, capture_output=True, text=True, check=False).stdout.strip()
    except OSError:
        return ""


def run_time_and_load(results_dir):
    """When the run ended (its newest result) and the load average then, as bench.sh noted it."""
    paths = glob.glob(os.path.join(results_dir, "*.json"))
    ended = max((os.path.getmtime(path) for path in paths), default=datetime.datetime.now().timestamp())
    try:
        with open(os.path.join(results_dir, "loadavg")) as source:
            load = [float(value) for value in source.read().split()[:3]]
    except (OSError, ValueError):
        load = list(os.getloadavg())
    return datetime.datetime.fromtimestamp(ended, datetime.timezone.utc), load


def machine_lines(build_dir, command, contexts, results_dir):
    cpu = "unknown CPU"
    try:
        with open("/proc/cpuinfo") as cpuinfo:
            for line in cpuinfo:
                if line.startswith("model name"):
                    cpu = line.split(":", 1)[1].strip()
                    break
    except OSError:
        pass
    compiler, flags = "", ""
    cache = os.path.join(build_dir, "CMakeCache.txt")
    if os.path.exists(cache):
        with open(cache) as source:
            for line in source:
                if line.startswith("CMAKE_CXX_COMPILER:"):
                    compiler_path = line.split("=", 1)[1].strip()
                    compiler = run_quiet([compiler_path, "--version"]).splitlines()[:1]
                    compiler = compiler[0] if compiler else compiler_path
    flag_files = sorted(glob.glob(os.path.join(build_dir, "bench", "CMakeFiles", "*.dir", "flags.make")))
    if flag_files:
        with open(flag_files[0]) as source:
            for line in source:
                if line.startswith("CXX_FLAGS"):
                    flags = line.split("=", 1)[1].strip()
    ended, load = run_time_and_load(results_dir)
    gbench = run_quiet(["dpkg-query", "-W", "-f=${Version}", "libbenchmark-dev"]) or "unknown"
    spdlog = run_quiet(["dpkg-query", "-W", "-f=${Version}", "libspdlog-dev"]) or "unknown"
    queue = run_quiet(["dpkg-query", "-W", "-f=${Version}", "libconcurrentqueue-dev"]) or "unknown"
    build_types = sorted({context.get("library_build_type") for context in contexts.values()} - {None})
    if build_types:
        gbench += f" (reports itself as a {'/'.join(build_types)} build; its own bookkeeping only)"
    mhz = sorted({context.get("mhz_per_cpu") for context in contexts.values()} - {None})
    if mhz:
        cpu += f" at {mhz[0]} MHz"
    return [
        f"- Machine: {cpu}, {os.cpu_count()} cores, Linux {platform.release()}",
        f"- Compiler: {compiler or 'unknown'}",
        f"- Flags: `{flags or 'unknown'}`",
        f"- Google Benchmark {gbench}; peers: spdlog {spdlog}, concurrentqueue {queue} (Debian packages)",
        f"- Date: {ended.strftime('%Y-%m-%d %H:%M UTC')}; load average at the end of the run (1, 5, 15 min): "
        f"{', '.join(f'{value:.2f}' for value in load)}",
        f"- Command: `{command}`",
    ]


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--results", required=True, help="directory of the run's JSON files")
    parser.add_argument("--build", required=True, help="the CMake build directory of the run")
    parser.add_argument("--notes", required=True, help="hand-written Markdown appended unchanged")
    parser.add_argument("--out", required=True)
    parser.add_argument("--command", default="scripts/bench.sh")
    parser.add_argument("--rounds", type=int, default=0, help="rounds per benchmark (for the text)")
    options = parser.parse_args()

    areas, other, contexts = load(options.results)
    marks, summary = check_targets(areas)
    out = ["# Benchmarks", "",
           "<!-- Generated by scripts/bench-report.py from one run of scripts/bench.sh; edit "
           + os.path.basename(options.notes) + " for the prose below the tables. -->", ""]
    out += machine_lines(options.build, options.command, contexts, options.results)
    rounds = f"{options.rounds} rounds" if options.rounds else "every round"
    out += ["", f"Figures are medians over {rounds}, with a second thread started before measuring. Google "
            "Benchmark shuffles every repetition of every benchmark of a program, so the contenders interleave; "
            "a contender's k-th repetition counts as its round k. \"Ours / contender\" is the ratio of the bold "
            "contender's figure to that row's, taken round by round (its median and min - max); above 1 favours "
            "libQNSystem. \"floor\" is the contract's floor: the same locks or system calls our calls must make, "
            "written with nothing of ours. Times (lower is better) are shown where a benchmark reports no "
            "items/s; their ratios are inverted, so above 1 still favours libQNSystem.", ""]

    service_lines, service_summary = service_table(areas.get("Service", {}))
    summary += service_summary
    if summary:
        out += ["## Targets", "", "| Area | Figure | Target | Measured (median, min - max) | Met |",
                "| --- | --- | --- | --- | --- |"]
        for area, what, target, shown, met in summary:
            out.append(f"| {area} | {what} | {target} | {shown} | {yes_no(met)} |")
        out.append("")

    for area in AREAS:
        cases = areas.get(area)
        if not cases:
            continue
        out += [f"## {area}", ""]
        if area == "Service":
            out += service_lines
        else:
            out += area_table(area, cases, marks)
        out.append("")
    if other:
        out += ["## Other benchmarks", "", "Names outside the Area/Case/Contender scheme, as measured.", "",
                "| Benchmark | Median | Min - max | Rounds |", "| --- | --- | --- | --- |"]
        for name, series in other.items():
            out.append(f"| `{name}` | {figure(series)} | {spread_text(series)} | {len(series.rounds)} |")
        out.append("")

    with open(options.notes) as notes:
        out.append(notes.read().rstrip("\n"))
    with open(options.out, "w") as target:
        target.write("\n".join(out) + "\n")


if __name__ == "__main__":
    main()
