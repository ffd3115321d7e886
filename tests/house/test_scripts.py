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
import xml.etree.ElementTree

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


def report(*runs):
    """A report of Google Benchmark's: runs of (name, time, unit, further keys)."""
    return json.dumps({"benchmarks": [
        {"name": name, "run_name": name, "real_time": time, "time_unit": unit, **more}
        for name, time, unit, more in runs]})


class BenchTable(unittest.TestCase):
    GOALS = """# work most of-what
change/1000   1.4
change/*      1.2
change/*      150  bytes_per_entry
twice         2.5  once
"""

    def table(self, *runs, goals=GOALS, against=()):
        with tempfile.TemporaryDirectory() as folder:
            paths = [pathlib.Path(folder, name) for name in ("new", "old", "goals")]
            for path, text in zip(paths, (report(*runs), report(*against), goals)):
                path.write_text(text)
            older = ["--against", paths[1]] if against else []
            unused = pathlib.Path(folder, "unused")  # of a program that had nothing to run
            unused.touch()
            done = subprocess.run(
                [sys.executable, "-B", SCRIPTS / "bench_table.py", "--goals", paths[2], paths[0], unused, *older],
                capture_output=True, text=True, check=True)
        return [" ".join(line.split()) for line in done.stdout.splitlines()]

    def test_shows_each_work_beside_its_floor_and_goal(self):
        self.assertEqual(
            self.table(("change/100/real_time", 15, "us", {}),
                       ("change_floor/100/real_time", 10000, "ns", {}),
                       ("change/1000", 14, "us", {}), ("change_floor/1000", 10, "us", {}),
                       ("alone", 4, "ms", {})),
            ["work floor ours ratio goal",
             "change/100 10 us 15 us 1.50 1.2 missed",
             "change/1000 10 us 14 us 1.40 1.4 met",
             "alone 4 ms"])

    def test_a_goal_may_be_of_a_counter_or_of_another_work(self):
        self.assertEqual(
            self.table(("change/100", 1, "us", {"bytes_per_entry": 180.4}),
                       ("once", 2, "s", {}), ("twice", 5, "s", {})),
            ["work floor ours ratio goal",
             "change/100 1 us", "bytes_per_entry 180 150 missed",
             "once 2 s", "twice 5 s", "to once 2 s 5 s 2.50 2.5 met"])

    def test_shows_an_older_build_beside_the_newer(self):
        self.assertEqual(
            self.table(("x", 5, "ms", {}), ("new", 1, "s", {}), against=[("x", 4, "ms", {}), ("gone", 1, "s", {})]),
            ["work before now ratio", "x 4 ms 5 ms 1.25"])

    def test_takes_the_median_of_repetitions(self):
        self.assertEqual(
            self.table(("x", 1, "ns", {}), ("x", 9, "ns", {}),
                       ("x", 5, "ns", {"aggregate_name": "median"}),
                       ("x", 3, "ns", {"aggregate_name": "stddev"}))[1:],
            ["x 5 ns"])

    def test_a_failed_benchmark_is_no_result(self):
        with self.assertRaises(subprocess.CalledProcessError):
            self.table(("x", 0, "ns", {"error_occurred": True, "error_message": "no phone"}))


class BenchPlots(unittest.TestCase):
    def test_draws_what_was_measured_at_three_sizes(self):
        with tempfile.TemporaryDirectory() as folder:
            runs = pathlib.Path(folder, "runs.json")
            runs.write_text(report(*(
                (f"{name}/{size}", size * factor, "us", {})
                for name, factor in (("change", 2), ("change_floor", 1)) for size in (10, 100, 1000)),
                ("few/1", 1, "us", {}), ("few/2", 2, "us", {})))
            subprocess.run([sys.executable, "-B", SCRIPTS / "bench_plots.py", f"{folder}/plots", runs],
                           capture_output=True, text=True, check=True)
            plots = {path.name: path.read_text() for path in pathlib.Path(folder, "plots").iterdir()}
        self.assertEqual(list(plots), ["change.svg"])
        paths = [node.get("d") for node in xml.etree.ElementTree.fromstring(plots["change.svg"]).iter()
                 if node.get("stroke-width") == "2"]
        # From 10 us to 10 ms up, from 10 to 1,000 across: each line rises by two decades of three.
        self.assertEqual(paths, ["M64.0 237.1L256.0 161.1L448.0 85.1", "M64.0 260.0L256.0 184.0L448.0 108.0"])


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
