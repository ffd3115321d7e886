"""The small tools of ./dev and CI."""

import importlib.util
import json
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

SCRIPTS = pathlib.Path(__file__).resolve().parents[2] / "scripts"


def load(name):
    specification = importlib.util.spec_from_file_location(name, SCRIPTS / f"{name}.py")
    module = importlib.util.module_from_spec(specification)
    specification.loader.exec_module(module)
    return module


def run(name, *files):
    """What a script prints when it is given files with these texts."""
    with tempfile.TemporaryDirectory() as folder:
        paths = []
        for number, text in enumerate(files):
            paths.append(pathlib.Path(folder, str(number)))
            paths[-1].write_text(text)
        done = subprocess.run([sys.executable, "-B", SCRIPTS / f"{name}.py", *paths],
                              capture_output=True, text=True, check=True)
        return done.stdout


class Behaviours(unittest.TestCase):
    LISTING = """Running main() from test_main.cpp
Client.
  KeepsItsAnchor
  TakesAnyName/0  # GetParam() = "a"
Fakes/FileManager.
  WritesAtomically/1  # GetParam() = 4-byte object
Codec/0.  # TypeParam = int
  RoundTrip
"""

    def setUp(self):
        self.script = load("check_behaviours")
        self.tests = self.script.program_tests(self.LISTING)

    def problems(self, row):
        table = f"| Behaviour | Tests |\n|---|---|\n{row}\n"
        return self.script.problems(table, self.tests)[1]

    def test_instances_count_as_one_test(self):
        self.assertEqual(self.tests, {"Client.KeepsItsAnchor", "Client.TakesAnyName",
                                      "FileManager.WritesAtomically", "Codec.RoundTrip"})

    def test_named_tests_must_exist(self):
        self.assertEqual(self.problems("| It keeps its anchor. | `Client.KeepsItsAnchor` |"), [])
        self.assertEqual(self.problems("| It flies. | `Client.KeepsItsAnchor`, `Client.Flies` |"),
                         ["line 3: there is no test Client.Flies"])

    def test_each_behaviour_needs_a_test(self):
        self.assertIn("without a test", self.problems("| It flies. | |")[0])

    def test_an_empty_document_is_no_success(self):
        self.assertEqual(self.problems("no table"), ["it names no behaviour"])

    def test_python_tests_are_found(self):
        names = set(self.script.python_tests(pathlib.Path(__file__)))
        self.assertIn("test_scripts.py::Behaviours.test_python_tests_are_found", names)


class BenchTable(unittest.TestCase):
    def report(self, *runs):
        return json.dumps({"benchmarks": [
            {"name": name, "run_name": name, "real_time": time, "time_unit": unit, **more}
            for name, time, unit, more in runs]})

    def test_shows_each_benchmark_beside_its_floor(self):
        table = run("bench_table", self.report(
            ("change/100/real_time", 15, "us", {}), ("change_floor/100/real_time", 10000, "ns", {}),
            ("change/1000", 99, "us", {"bytes_per_entry": 180.4}), ("alone", 4, "ms", {"floor_ratio": 2.0})))
        rows = [line.split() for line in table.splitlines()]
        self.assertEqual(rows, [["benchmark", "time", "floor", "ratio", "bytes/entry"],
                                ["change/100", "15", "us", "10", "us", "1.50"],
                                ["change/1000", "99", "us", "180"],
                                ["alone", "4", "ms", "2", "ms", "2.00"]])

    def test_takes_the_median_of_repetitions(self):
        table = run("bench_table", self.report(
            ("x", 1, "ns", {}), ("x", 9, "ns", {}),
            ("x", 5, "ns", {"aggregate_name": "median"}), ("x", 3, "ns", {"aggregate_name": "stddev"})))
        self.assertEqual(table.splitlines()[1].split(), ["x", "5", "ns"])


class CoverageTable(unittest.TestCase):
    def test_sums_up_what_we_ship_by_folder(self):
        def file(path, count, covered):
            return {"filename": path, "summary": {"lines": {"count": count, "covered": covered}}}

        summary = {"data": [{"files": [
            file("/r/device/home/a.cpp", 30, 30), file("/r/device/home/b.h", 10, 0),
            file("/r/client/c.cpp", 60, 59), file("/r/tests/client/t.cpp", 9, 9),
            file("/usr/include/client/x.h", 9, 9)]}]}
        done = subprocess.run([sys.executable, "-B", SCRIPTS / "coverage_table.py", "/r"],
                              input=json.dumps(summary), capture_output=True, text=True, check=True)
        self.assertEqual([line.split() for line in done.stdout.splitlines()],
                         [["folder", "lines", "reached"], ["client", "60", "98.3%"],
                          ["device/home", "40", "75.0%"], ["all", "100", "89.0%"]])


class Totals(unittest.TestCase):
    def test_adds_up_reports(self):
        one = '<testsuite tests="7" failures="2" disabled="1" skipped="1"/>'
        two = '<testsuite tests="5" failures="0" disabled="0" skipped="0"/>'
        self.assertEqual(run("test_totals", one, two), "8 passed, 2 failed, 2 skipped\n")

    def test_no_report_is_nothing_passed(self):
        self.assertEqual(run("test_totals"), "0 passed, 0 failed, 0 skipped\n")


class TerminalPicture(unittest.TestCase):
    def setUp(self):
        self.script = load("terminal_picture")

    @staticmethod
    def drawing(*lines):
        return "\n".join(f'<text x="18.0" y="{20 * number}.2" fill="#fff">{line}</text>'
                         for number, line in enumerate(lines))

    def test_a_picture_is_stale_when_it_says_something_else(self):
        kept = self.drawing("$ appsync sync", "installed &quot;A&quot;", "done  1 installed")
        self.assertEqual(self.script.difference(kept, kept), [])
        changed = self.drawing("$ appsync sync", "installed &quot;A&quot;", "done  1 new")
        self.assertEqual(self.script.difference(kept, changed)[-2:],
                         ["-done  1 installed", "+done  1 new"])
        self.assertNotEqual(self.script.difference(kept, self.drawing("$ appsync sync")), [])

    def test_the_order_of_installs_and_long_numbers_do_not_matter(self):
        self.assertEqual(self.script.difference(
            self.drawing("installed A", "installed B", "read 105387 bytes"),
            self.drawing("installed B", "installed A", "read 98213 bytes")), [])


class Setup(unittest.TestCase):
    def test_who_may_not_install_is_told_all_that_to_type(self):
        with tempfile.TemporaryDirectory() as folder:
            tools = pathlib.Path(folder, "tools")
            tools.mkdir()
            for name in ("bash", "sed"):
                (tools / name).symlink_to(shutil.which(name))
            (tools / "dpkg-query").write_text("#!/bin/bash\n")
            (tools / "dpkg-query").chmod(0o755)
            shutil.copytree(SCRIPTS, pathlib.Path(folder, "scripts"))
            pathlib.Path(folder, "scripts/packages.txt").write_text("g++ 4:12.* build\n")
            pathlib.Path(folder).chmod(0o755)
            nobody = {"user": 65534, "group": 65534, "extra_groups": []} if os.geteuid() == 0 else {}
            done = subprocess.run(
                [tools / "bash", "-c", 'die() { echo "$*" >&2; exit 1; }; source scripts/setup.sh; '
                 "need build"], cwd=folder, env={"PATH": str(tools)}, capture_output=True,
                text=True, **nobody)
        self.assertEqual((done.returncode, done.stderr),
                         (1, "as root: apt-get update && apt-get install g++=4:12.*\n"))


if __name__ == "__main__":
    unittest.main()
