#!/usr/bin/env python3
"""Prints one table of Google Benchmark's JSON reports.

A work "name/size" is shown beside its floor "name_floor/size", the least work that any solution has
to do, and with what bench/goals.txt asks of it. With --benchmark_repetitions the medians are taken.
With --against an older build's reports are shown beside the newer ones instead.

usage: bench_table.py [--goals FILE] REPORT.json... [--against REPORT.json...]
"""

import argparse
import fnmatch
import pathlib

from bench_report import duration, floor_of, is_floor, read

GOALS = pathlib.Path(__file__).resolve().parents[1] / "bench/goals.txt"


def read_goals(path):
    """[pattern, most, of what]; "of what" is "" for the work's own floor."""
    lines = (line.split() for line in pathlib.Path(path).read_text().splitlines())
    return [(*words, "")[:3] for words in lines if words and not words[0].startswith("#")]


def goals_of(name, goals):
    """of what -> most."""
    found = {}
    for pattern, most, measure in goals:
        if fnmatch.fnmatchcase(name, pattern):
            found.setdefault(measure, float(most))
    return found


def verdict(value, most):
    return (f"{most:g}", "met" if value <= most else "missed") if most is not None else ("", "")


def compared(label, time, other, most):
    ratio = time / other
    return (label, duration(other), duration(time), f"{ratio:.2f}", *verdict(ratio, most))


def rows(results, goals):
    for name, (time, run) in results.items():
        if is_floor(name):
            continue
        wanted = goals_of(name, goals)
        floor = results.get(floor_of(name))
        if floor:
            yield compared(name, time, floor[0], wanted.get(""))
        else:
            yield (name, "", duration(time), "", "", "")
        for measure, most in wanted.items():
            if measure in results:
                yield compared(f"  to {measure}", time, results[measure][0], most)
            elif measure in run:
                value = run[measure]
                yield (f"  {measure}", "", f"{value:.0f}", "", *verdict(value, most))


def pairs(new, old):
    for name, (time, _) in new.items():
        if name in old:
            before = old[name][0]
            yield (name, duration(before), duration(time), f"{time / before:.2f}")


def table(lines):
    widths = [max(len(line[i]) for line in lines) for i in range(len(lines[0]))]
    for line in lines:
        cells = [line[0].ljust(widths[0])] + [c.rjust(w) for c, w in zip(line[1:], widths[1:])]
        print("  ".join(cells).rstrip())


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("reports", nargs="+")
    parser.add_argument("--goals", default=GOALS)
    parser.add_argument("--against", nargs="+")
    options = parser.parse_args()
    results = read(*options.reports)
    if options.against:
        table([("work", "before", "now", "ratio"), *pairs(results, read(*options.against))])
    else:
        table([("work", "floor", "ours", "ratio", "goal", ""),
               *rows(results, read_goals(options.goals))])


if __name__ == "__main__":
    main()
