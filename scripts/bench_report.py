"""Reads Google Benchmark's JSON reports."""

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


def read(*paths):
    """name -> (time in ns, run) of some reports; medians where there are several runs."""
    results = {}
    for path in paths:
        text = pathlib.Path(path).read_text()
        if not text:  # no benchmark of that program was asked for
            continue
        for run in json.loads(text)["benchmarks"]:
            if run.get("error_occurred"):
                sys.exit(f"{path}: {run['name']}: {run.get('error_message')}")
            aggregate = run.get("aggregate_name")
            if aggregate not in (None, "median"):
                continue
            name = plain_name(run)
            if aggregate == "median" or name not in results:
                results[name] = (run["real_time"] * NANOSECONDS[run["time_unit"]], run)
    return results


def is_floor(name):
    return name.split("/")[0].endswith("_floor")


def floor_of(name):
    head, *rest = name.split("/")
    return "/".join([head + "_floor", *rest])


def duration(ns):
    for unit, size in (("s", 1e9), ("ms", 1e6), ("us", 1e3)):
        if ns >= size:
            return f"{ns / size:.3g} {unit}"
    return f"{ns:.3g} ns"
