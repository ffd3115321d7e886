#!/usr/bin/env python3
"""Prints one table of Google Benchmark's JSON reports.

A benchmark "name/size" is shown beside its floor "name_floor/size" of the same program: the least
work that any solution has to do. Where a benchmark has no floor of its own, its counter
"floor_ratio", if any, is shown. The counter "bytes_per_entry" is the memory that it took. With
--benchmark_repetitions the medians are taken.

usage: bench_table.py REPORT.json...
"""

import json
import pathlib
import sys

NANOSECONDS = {"ns": 1, "us": 1e3, "ms": 1e6, "s": 1e9}
# What Google Benchmark appends to a name to tell how it was measured.
DECORATIONS = {"real_time", "process_time", "manual_time"}


def plain_name(run):
    name = run.get("run_name", run["name"])
    parts = [p for p in name.split("/") if p not in DECORATIONS]
    return "/".join(p for p in parts if not p.startswith(("iterations:", "repeats:", "min_time:")))


def read(path):
    """name -> (time in ns, run) of one report; medians where there are several runs."""
    results = {}
    for run in json.loads(pathlib.Path(path).read_text())["benchmarks"]:
        if run.get("error_occurred"):
            sys.exit(f"{path}: {run['name']}: {run.get('error_message')}")
        aggregate = run.get("aggregate_name")
        if aggregate not in (None, "median"):
            continue
        name = plain_name(run)
        if aggregate == "median" or name not in results:
            results[name] = (run["real_time"] * NANOSECONDS[run["time_unit"]], run)
    return results


def floor_of(name, results):
    head, *rest = name.split("/")
    return results.get("/".join([head + "_floor", *rest]))


def duration(ns):
    for unit, size in (("s", 1e9), ("ms", 1e6), ("us", 1e3)):
        if ns >= size:
            return f"{ns / size:.3g} {unit}"
    return f"{ns:.3g} ns"


def rows(results):
    for name, (time, run) in results.items():
        if name.split("/")[0].endswith("_floor"):
            continue
        floor = floor_of(name, results)
        ratio = time / floor[0] if floor else run.get("floor_ratio")
        beside = (duration(time / ratio), f"{ratio:.2f}") if ratio else ("", "")
        memory = f"{run['bytes_per_entry']:.0f}" if "bytes_per_entry" in run else ""
        yield (name, duration(time), *beside, memory)


def table(lines):
    widths = [max(len(line[i]) for line in lines) for i in range(len(lines[0]))]
    for line in lines:
        cells = [line[0].ljust(widths[0])] + [c.rjust(w) for c, w in zip(line[1:], widths[1:])]
        print("  ".join(cells).rstrip())


def main():
    if len(sys.argv) < 2:
        sys.exit("no benchmark reports")
    lines = [("benchmark", "time", "floor", "ratio", "bytes/entry")]
    for path in sys.argv[1:]:
        lines.extend(rows(read(path)))
    table(lines)


if __name__ == "__main__":
    main()
