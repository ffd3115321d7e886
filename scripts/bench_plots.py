#!/usr/bin/env python3
"""Draws time against size, both logarithmic, of each work that a run measured at three sizes or more.

usage: bench_plots.py FOLDER REPORT.json...      writes FOLDER/WORK.svg
"""

import collections
import html
import math
import pathlib
import sys

from bench_report import duration, floor_of, is_floor, read

WIDTH, HEIGHT = 480, 300
LEFT, RIGHT, TOP, BOTTOM = 64, 32, 32, 40
OURS, FLOOR, GRID, TEXT = "#1f6feb", "#8b949e", "#d0d7de", "#57606a"


def series(results):
    """work -> [(size, time in ns)], in the order of the sizes."""
    found = collections.defaultdict(list)
    for name, (time, _) in results.items():
        head, _, size = name.rpartition("/")
        if head and size.isdigit() and int(size) > 0:
            found[head].append((int(size), time))
    return {name: sorted(points) for name, points in found.items()}


def decades(values):
    """The powers of ten around the values."""
    low, high = math.floor(math.log10(min(values))), math.ceil(math.log10(max(values)))
    return range(low, max(high, low + 1) + 1)


def drawing(title, lines):
    """An SVG picture of lines: (label, colour, points)."""
    points = [point for _, _, line in lines for point in line]
    across, up = decades([x for x, _ in points]), decades([y for _, y in points])

    def x(value):
        share = (math.log10(value) - across[0]) / (across[-1] - across[0])
        return round(LEFT + share * (WIDTH - LEFT - RIGHT), 1)

    def y(value):
        share = (math.log10(value) - up[0]) / (up[-1] - up[0])
        return round(HEIGHT - BOTTOM - share * (HEIGHT - TOP - BOTTOM), 1)

    def text(at_x, at_y, words, colour=TEXT, anchor="middle"):
        return (f'<text x="{at_x}" y="{at_y}" fill="{colour}" text-anchor="{anchor}">'
                f"{html.escape(words)}</text>")

    def rule(x1, y1, x2, y2):
        return f'<path d="M{x1} {y1}L{x2} {y2}" stroke="{GRID}"/>'

    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" viewBox="0 0 {WIDTH} {HEIGHT}" '
             'font-family="sans-serif" font-size="12">',
             f'<rect width="{WIDTH}" height="{HEIGHT}" fill="#fff"/>',
             text(LEFT, 20, title, "#24292f", "start")]
    for power in across:
        at = x(10**power)
        parts += [rule(at, TOP, at, HEIGHT - BOTTOM), text(at, HEIGHT - 20, f"{10**power:,}")]
    for power in up:
        at = y(10**power)
        parts += [rule(LEFT, at, WIDTH - RIGHT, at), text(LEFT - 6, at + 4, duration(10**power), TEXT, "end")]
    for number, (label, colour, line) in enumerate(lines):
        path = "L".join(f"{x(a)} {y(b)}" for a, b in line)
        parts += [f'<path d="M{path}" fill="none" stroke="{colour}" stroke-width="2"/>',
                  *(f'<circle cx="{x(a)}" cy="{y(b)}" r="3" fill="{colour}"/>' for a, b in line),
                  text(WIDTH - RIGHT - 60 * number, 20, label, colour, "end")]
    return "\n".join([*parts, "</svg>", ""])


def main():
    if len(sys.argv) < 3:
        sys.exit(__doc__)
    folder = pathlib.Path(sys.argv[1])
    folder.mkdir(parents=True, exist_ok=True)
    measured = series(read(*sys.argv[2:]))
    for name, points in measured.items():
        if is_floor(name) or len(points) < 3:
            continue
        lines = [("ours", OURS, points)]
        if floor_of(name) in measured:
            lines.append(("floor", FLOOR, measured[floor_of(name)]))
        (folder / (name.replace("/", "-") + ".svg")).write_text(drawing(name, lines))


if __name__ == "__main__":
    main()
