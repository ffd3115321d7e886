#!/usr/bin/python3
"""Runs a command in a terminal of its own and draws what the screen shows at the end as an SVG.

Made for the README's picture; needs Debian's python3-pyte.

usage: terminal_picture.py [--check] -o FILE.svg [--columns N] [--rows N] COMMAND [ARGUMENT...]

With --check it draws nothing, but fails when the picture in FILE.svg says something else.
"""

import argparse
import collections
import difflib
import html
import os
import pty
import re
import sys

COLOURS = {"default": "#d8dee9", "red": "#ff7b72", "green": "#7ee787", "brown": "#e3b341",
           "blue": "#79c0ff", "magenta": "#d2a8ff", "cyan": "#76e3ea", "white": "#ffffff",
           "black": "#6e7681"}
ADVANCE, LINE, MARGIN = 8.43, 19, 18  # pixels, at 14 pixels of font size


def screen_after(command, columns, rows):
    import pyte
    screen = pyte.Screen(columns, rows)
    stream = pyte.ByteStream(screen)
    child, terminal = pty.fork()
    if child == 0:
        os.environ.update(TERM="xterm-256color", COLUMNS=str(columns), LINES=str(rows))
        os.execvp(command[0], command)
    while True:
        try:
            data = os.read(terminal, 65536)
        except OSError:  # the command has ended
            break
        if not data:
            break
        stream.feed(data)
    os.waitpid(child, 0)
    return screen


def runs(line, columns):
    """The line as (column, text, colour, bold), one for each stretch of the same look."""
    found = []
    for column in range(columns):
        cell = line[column]
        look = (COLOURS.get(cell.fg, COLOURS["default"]), cell.bold)
        if found and found[-1][2:] == look and found[-1][0] + len(found[-1][1]) == column:
            found[-1] = (found[-1][0], found[-1][1] + cell.data, *look)
        else:
            found.append((column, cell.data, *look))
    return [run for run in found if run[1].strip()]


def picture(screen):
    used = max((row for row in range(screen.lines) if screen.display[row].strip()), default=0) + 1
    width, height = screen.columns * ADVANCE + 2 * MARGIN, used * LINE + 2 * MARGIN
    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" width="{width:.0f}" height="{height}" '
             f'font-family="DejaVu Sans Mono, Menlo, Consolas, monospace" font-size="14">',
             f'<rect width="100%" height="100%" rx="10" fill="#0d1117"/>']
    for row in range(used):
        for column, text, colour, bold in runs(screen.buffer[row], screen.columns):
            weight = ' font-weight="bold"' if bold else ""
            x, y = MARGIN + column * ADVANCE, MARGIN + (row + 0.75) * LINE
            text = text.rstrip()
            parts.append(f'<text x="{x:.1f}" y="{y:.1f}" fill="{colour}"{weight} xml:space="preserve" '
                         f'textLength="{len(text) * ADVANCE:.1f}">{html.escape(text)}</text>')
    return "\n".join([*parts, "</svg>", ""])


def said(drawing):
    """The lines of a picture. In order of their texts: installs that run side by side end in any
    order. Without long numbers, which depend on the archivers of the machine."""
    rows = collections.defaultdict(list)
    for y, text in re.findall(r'<text [^>]*\by="([^"]+)"[^>]*>([^<]*)</text>', drawing):
        rows[y].append(re.sub(r"\d{4,}", "#", html.unescape(text)))
    return sorted(" ".join(row) for row in rows.values())


def difference(kept, drawn):
    """What the picture that is kept says otherwise than the one just drawn; empty for nothing."""
    return list(difflib.unified_diff(said(kept), said(drawn), "the picture", "the command", "", "",
                                     0, ""))


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("-o", dest="output", required=True)
    parser.add_argument("--columns", type=int, default=100)
    parser.add_argument("--rows", type=int, default=60)
    parser.add_argument("command", nargs=argparse.REMAINDER)
    parser.add_argument("--check", action="store_true")
    given = parser.parse_args()
    drawn = picture(screen_after(given.command, given.columns, given.rows))
    if given.check:
        with open(given.output) as kept:
            stale = difference(kept.read(), drawn)
        if stale:
            sys.exit("\n".join([f"{given.output} is stale: draw it anew", *stale]))
        return
    with open(given.output, "w") as output:
        output.write(drawn)


if __name__ == "__main__":
    main()
