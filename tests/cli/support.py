"""What the tests of the command share: a phone, a library, and the command itself."""

import json
import os
import pathlib
import plistlib
import random
import subprocess
import tempfile
import unittest
import zipfile

APPSYNC = os.environ["APPSYNC"]

EVENTS = {
    "package-problem": {"file": str, "reason": str},
    "plan": {"action": str, "identifier": str, "version": (str, type(None)),
             "installedVersion": (str, type(None)), "name": str},
    "placeholder-removed": {"identifier": str},
    "deleted-on-phone": {"identifier": str},
    "transfer": {"identifier": str, "name": str, "sent": int, "total": int},
    "transfer-ended": {"identifier": str, "success": bool},
    "data": {"identifier": str, "name": str, "done": int, "total": int},
    "data-ended": {"identifier": str, "success": bool},
    "saving": {"identifier": str, "name": str, "bytes": int, "number": int, "count": int},
    "saved": {"identifier": str, "name": str, "success": bool},
    "placeholder": {"identifier": str, "name": str, "demoted": bool},
    "notice": {"message": str},
    "waiting": {"identifier": str, "retrySeconds": int, "message": str},
    "install-ended": {"identifier": str, "success": bool},
    "log": {"channel": str, "level": str, "text": str},
    "interrupted": {},
    "error": {"message": str},
    "summary": {"installed": list, "updated": list, "downgraded": list, "deleted": list,
                "failed": list, "skipped": list, "dataRestored": list},
    "backup-summary": {"saved": list, "failed": list},
}


def info(identifier, version="1.0", name=None, **more):
    return {"KBBundleIdentifier": identifier, "KBBundleVersion": version,
            "KBBundleDisplayName": name or identifier.split(".")[-1].title(),
            "KBBundleExecutable": "run", **more}


def noise(size):
    """Bytes that no archiver makes smaller."""
    return random.Random(size).randbytes(size)


class Case(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)
        self.phone = self.folder / "phone"
        self.library = self.folder / "library"
        self.library.mkdir()
        self.environment = {key: value for key, value in os.environ.items()
                            if not key.startswith("APPSYNC") and key != "NO_COLOR"}
        self.environment["APPSYNC_DEVICE"] = str(self.phone)

    def run_appsync(self, *arguments, code=0, **options):
        """Runs the command, insists on its exit code, and gives what it wrote on both outputs."""
        done = subprocess.run([APPSYNC, *map(str, arguments)], capture_output=True, text=True,
                              timeout=120, env=self.environment, **options)
        self.assertEqual(done.returncode, code, f"{arguments}: {done.stdout}{done.stderr}")
        return done.stdout, done.stderr

    def start(self, *arguments, **options):
        """The command, running. It gets no further ahead of whoever reads than a page of output."""
        process = subprocess.Popen([APPSYNC, *map(str, arguments)], stdout=subprocess.PIPE,
                                   stderr=subprocess.PIPE, text=True, env=self.environment,
                                   pipesize=4096, **options)
        self.addCleanup(self.stop, process)
        return process

    @staticmethod
    def rest(process):
        """All that it still writes on both outputs, until it ends. communicate() would lose what was
        read ahead with the lines before."""
        out, err = process.stdout.read(), process.stderr.read()
        process.wait(timeout=60)
        return out, err

    @staticmethod
    def stop(process):
        process.kill()
        process.communicate()

    def json_lines(self, *arguments, code=0):
        """The objects written with --json; nothing else may be on either output."""
        out, err = self.run_appsync("--json", *arguments, code=code)
        self.assertEqual(err, "")
        return [json.loads(line) for line in out.splitlines()]

    def check_events(self, events, summary="summary"):
        """`summary` names what the last event must hold."""
        for event in events:
            expected = EVENTS[summary if event["event"] == "summary" else event["event"]]
            for key, kind in expected.items():
                self.assertIsInstance(event[key], kind, event)
            allowed = {"event", *expected}
            if event.get("success") is False:
                allowed.add("reason")
                if event["event"] == "install-ended":
                    allowed.add("file")
            self.assertEqual(set(event), allowed, event)
        self.assertEqual([event["event"] for event in events].count("summary"), 1)
        self.assertEqual(events[-1]["event"], "summary")

    def sync(self, *arguments, code=0):
        """A whole sync of the library; its summary."""
        events = self.json_lines("sync", self.library, *arguments, code=code)
        self.check_events(events)
        self.events = events
        return events[-1]

    def init(self, *arguments):
        self.run_appsync("init", *arguments)

    def bundle(self, identifier, version="1.0", body=b"", name=None, **more):
        """An application folder."""
        name = name or identifier.split(".")[-1].title()
        bundle = self.folder / "sources" / identifier / version / f"{name}.app"
        bundle.mkdir(parents=True, exist_ok=True)
        (bundle / "Info.plist").write_bytes(plistlib.dumps(info(identifier, version, name, **more)))
        (bundle / "run").write_text("#!/bin/sh\necho hello\n")
        (bundle / "run").chmod(0o755)
        if body:
            (bundle / "body").write_bytes(body)
        return bundle

    def offer(self, identifier, version="1.0", body=b"", ending=".zip", name=None):
        """A package in the library."""
        package = self.library / f"{identifier}{ending}"
        self.run_appsync("package", self.bundle(identifier, version, body, name), "-o", package)
        return package

    def offer_raw(self, name, entries):
        """A zip package that holds just these entries."""
        with zipfile.ZipFile(self.library / name, "w", zipfile.ZIP_DEFLATED) as package:
            for entry, contents in entries.items():
                package.writestr(entry, contents)

    def apps(self):
        """Identifier to version of what is installed; placeholders end in "?"."""
        return {app["identifier"] + ("?" if app["placeholder"] else ""): app["version"]
                for app in self.json_lines("apps")}

    def phone_tree(self):
        """Every file that the phone sees, with its contents."""
        root = self.phone / "root"
        return {str(path.relative_to(root)): path.read_bytes() if path.is_file() else None
                for path in sorted(root.rglob("*"))}


def main():
    unittest.main()
