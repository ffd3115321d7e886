#!/usr/bin/env python3
"""Checks that every test named in docs/behaviours.md exists.

The document holds tables "| behaviour | tests |"; a test is given in backticks, as "Suite.Name" of a
test program or as "file.py::Class.method". Instances of a parameterised test count as one test.

usage: check_behaviours.py BUILD_FOLDER [DOCUMENT]      exit 0: all exist, 1: some do not
"""

import ast
import os
import pathlib
import re
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parents[1]


def program_tests(listing):
    """The tests of a --gtest_list_tests listing as "Suite.Name", without instance names."""
    tests, suite = set(), ""
    for line in listing.splitlines():
        name = line.split("#")[0].rstrip()
        if not name.startswith(" "):
            parts = name.rstrip(".").split("/")
            # "Instance/Suite" of value-parameterised, "Suite/0" of typed tests, or both.
            suite = next((p for p in reversed(parts) if not p.isdigit()), "")
        elif suite:
            tests.add(f"{suite}.{name.strip().split('/')[0]}")
    return tests


def python_tests(path):
    for node in ast.parse(path.read_text()).body:
        if isinstance(node, ast.ClassDef):
            for method in node.body:
                if isinstance(method, ast.FunctionDef) and method.name.startswith("test"):
                    yield f"{path.name}::{node.name}.{method.name}"


def existing_tests(build):
    programs = [p for p in (build / "tests").rglob("*_tests") if p.is_file() and os.access(p, os.X_OK)]
    if not programs:
        sys.exit(f"{build}: no test programs; build them first")
    tests = set()
    for program in programs:
        tests |= program_tests(
            subprocess.run([program, "--gtest_list_tests"], check=True, capture_output=True, text=True).stdout)
    for path in (ROOT / "tests").rglob("test_*.py"):
        tests.update(python_tests(path))
    return tests


def rows(document):
    """(line number, behaviour, tests) of each row of the document's tables."""
    for number, line in enumerate(document.splitlines(), 1):
        cells = [cell.strip() for cell in line.strip().strip("|").split("|")]
        if not line.startswith("|") or set(line) <= set("|-: ") or cells[-1] == "Tests":
            continue
        yield number, cells[0], re.findall(r"`([^`]+)`", cells[-1])


def problems(document, tests):
    found = []
    count = 0
    for number, behaviour, named in rows(document):
        count += 1
        if not behaviour or not named:
            found.append(f"line {number}: a behaviour without a test")
        found.extend(f"line {number}: there is no test {n}" for n in named if n not in tests)
    if count == 0:
        found.append("it names no behaviour")
    return count, found


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    path = pathlib.Path(sys.argv[2]) if len(sys.argv) > 2 else ROOT / "docs" / "behaviours.md"
    count, found = problems(path.read_text(), existing_tests(pathlib.Path(sys.argv[1])))
    for line in found:
        print(f"{path.name}: {line}")
    print(f"behaviours: {count}, {len(found)} problems")
    sys.exit(1 if found else 0)


if __name__ == "__main__":
    main()
