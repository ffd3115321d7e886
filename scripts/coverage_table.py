"""Prints, for each folder, how many of its lines the tests reach; reads llvm-cov's summary as JSON.

usage: llvm-cov export -summary-only ... | coverage_table.py [ROOT]
"""

import collections
import json
import pathlib
import sys

SHIPPED = ["platform", "client", "sync", "transfer", "coordination", "restore", "base", "icons", "packages", "device", "host"]


def folders(summary, root):
    """(folder, lines, lines reached) of each folder of what we ship, in the order of SHIPPED."""
    totals = collections.defaultdict(lambda: [0, 0])
    for file in summary["data"][0]["files"]:
        path = pathlib.Path(file["filename"])
        if not path.is_relative_to(root):
            continue
        folder = path.relative_to(root).parent
        if folder.parts and folder.parts[0] in SHIPPED:
            lines = file["summary"]["lines"]
            totals[folder][0] += lines["count"]
            totals[folder][1] += lines["covered"]
    for folder in sorted(totals, key=lambda folder: (SHIPPED.index(folder.parts[0]), folder)):
        yield str(folder), *totals[folder]


def main():
    root = pathlib.Path(*sys.argv[1:2] or ["."]).resolve()
    rows = list(folders(json.load(sys.stdin), root))
    rows.append(("all", sum(row[1] for row in rows), sum(row[2] for row in rows)))
    print(f"{'folder':24} {'lines':>7} {'reached':>8}")
    for folder, count, reached in rows:
        share = 100 * reached / count if count else 100
        print(f"{folder:24} {count:7} {share:7.1f}%")


if __name__ == "__main__":
    main()
