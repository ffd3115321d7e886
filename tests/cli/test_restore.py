"""Backups that come back to new phones, whole, in parts and interrupted."""

import json
import plistlib
import signal

import support
from restore_support import DATA, WAITING, RestoreCase

DEMOTED = "stays a placeholder until it is asked for"
NOT_IN_STORE = "the store does not have it"


class Restores(RestoreCase):
    def files(self):
        return {path: contents for path, contents in self.phone_tree().items()
                if contents is not None}

    def test_without_a_store(self):
        self.use("new")
        summary = self.restore()
        self.assertEqual(self.reasons(summary["skipped"]), {
            "com.a": "waits for its package", "com.b": "waits for its package",
            "com.c": DEMOTED, "com.d": DEMOTED})
        self.assertEqual((summary["installed"], summary["failed"]), ([], []))
        told = {event["identifier"]: (event["name"], event["demoted"])
                for event in self.events if event["event"] == "placeholder"}
        self.assertEqual(told, {"com.a": ("A", False), "com.b": ("B", False),
                                "com.c": ("C", True), "com.d": ("D", True)})
        self.assertEqual(self.apps(), {f"com.{letter}?": "1.0" for letter in "abcd"})
        self.assertEqual(self.notes("com.a", WAITING), "notes of com.a")
        self.assertIsNone(self.notes("com.b", WAITING))

    def test_with_a_store(self):
        self.use("new")
        summary = self.restore("--store", self.library)
        self.assertEqual(summary["installed"], ["com.a", "com.b"])
        self.assertEqual(self.reasons(summary["skipped"]), {"com.c": DEMOTED, "com.d": DEMOTED})
        self.assertEqual(self.apps(),
                         {"com.a": "1.0", "com.b": "1.0", "com.c?": "1.0", "com.d?": "1.0"})
        self.assertEqual(self.notes("com.a"), "notes of com.a")
        self.assertEqual((self.phone / DATA / "com.a/latest").readlink().name, "notes")
        self.assertEqual(list((self.phone / "root/var/mobile/Media/Downloads").iterdir()), [])

        before = self.files()
        summary = self.restore("--store", self.library)
        self.assertEqual(summary["installed"], [])
        self.assertIn("left as they are", self.reasons(summary["skipped"])["com.a"])
        self.assertEqual(self.files(), before)

    def test_data_of_an_installed_application(self):
        notes = self.phone / DATA / "com.a/Documents/notes"
        notes.write_text("newer")
        out, _ = self.run_appsync("restore", self.backup, "--only", "com.a")
        self.assertEqual(out, "skipped    com.a: is installed: it and its data are left as "
                              "they are (--overwrite-data gives back the backup's)\n"
                              "done       nothing to do: 1 skipped\n")
        self.assertEqual(notes.read_text(), "newer")
        self.run_appsync("launch", "com.a")
        summary = self.restore("--overwrite-data", "--only", "com.a", code=1)
        self.assertEqual(list(self.reasons(summary["failed"])), ["com.a"])
        self.assertEqual(notes.read_text(), "newer")
        self.run_appsync("quit", "com.a")
        self.assertEqual(self.restore("--overwrite-data")["dataRestored"], ["com.a"])
        self.assertEqual(self.notes("com.a"), "notes of com.a")
        last = self.json_lines("history")[-1]
        self.assertEqual((last["event"], last["identifier"], last["version"]),
                         ("data-overwritten", "com.a", "1.0"))
        self.assertEqual(self.restore("--overwrite-data")["dataRestored"], [])

    def test_no_package_is_installed_while_that_is_forbidden(self):
        self.use("new")
        self.run_appsync("policy", "--installing", "forbid")
        forbidden = "installing applications is forbidden on the phone"
        summary = self.restore("--store", self.library)
        self.assertIn(forbidden, self.reasons(summary["skipped"])["com.a"])
        summary = self.restore("--store", self.library, "--only", "com.a", code=1)
        self.assertIn(forbidden, self.reasons(summary["failed"])["com.a"])
        self.assertEqual(self.apps(), {"com.a?": "1.0", "com.b?": "1.0", "com.c?": "1.0",
                                       "com.d?": "1.0"})
        self.run_appsync("policy", "--installing", "allow")
        self.assertEqual(self.restore("--store", self.library)["installed"], ["com.a", "com.b"])

    def test_only_what_is_named(self):
        self.use("new")
        before = self.phone_tree()
        [error] = self.json_lines("restore", self.backup, "--only", "com.x", code=2)
        self.assertEqual(error["message"], "the backup has no application com.x")
        self.assertEqual(self.phone_tree(), before)
        self.restore("--only", "com.b", "--only", "com.d", "--store", self.library)
        self.assertEqual(self.apps(), {"com.b": "1.0", "com.d?": "1.0"})

    def test_with_a_store_that_has_only_some(self):
        (self.library / "com.a.zip").unlink()
        (self.library / "broken.zip").write_bytes(b"garbage")
        self.use("new")
        summary = self.restore("--store", self.library)
        self.assertEqual(summary["installed"], ["com.b"])
        self.assertEqual(self.reasons(summary["skipped"]), {
            "com.a": NOT_IN_STORE, "com.c": DEMOTED, "com.d": DEMOTED,
            "broken.zip": "it is neither a zip nor a tar archive"})
        summary = self.restore("--store", self.library, "--only", "com.a", code=1)
        self.assertEqual(self.reasons(summary["failed"]), {"com.a": NOT_IN_STORE})

    def test_backup_restore_backup_gives_the_same(self):
        self.use("new")
        self.restore("--store", self.library)
        self.take_backup(self.folder / "second")
        self.check_same(self.backup, self.folder / "second")

    def test_placeholders_back_up_the_same(self):
        self.use("new")
        self.restore()
        self.take_backup(self.folder / "second")
        self.check_same(self.backup, self.folder / "second")

    def test_damaged_data_of_one_application(self):
        archive = self.backup / "Data/com.a.tar"
        whole = archive.read_bytes()
        archive.write_bytes(whole.replace(b"notes of com.a", b"notes of com.X"))
        self.use("new")
        summary = self.restore("--store", self.library, code=1)
        self.assertEqual(self.reasons(summary["failed"]), {
            "com.a": "its data in the backup is damaged: com.a.tar does not match its digest"})
        self.assertEqual(summary["installed"], ["com.b"])
        self.assertNotIn("com.a", str(self.apps()))
        archive.write_bytes(whole)
        self.assertEqual(self.restore("--store", self.library)["installed"], ["com.a"])
        self.assertEqual(self.notes("com.a"), "notes of com.a")

    def test_plain_lines(self):
        self.use("new")
        out, err = self.run_appsync("restore", self.backup, "--store", self.library)
        self.assertEqual(err, "")
        lines = out.splitlines()
        lines[4:6] = sorted(lines[4:6])  # the store's installs run beside one another
        self.assertEqual(lines, [
            "restored   A 1.0 (com.a) as a placeholder",
            "restored   B 1.0 (com.b) as a placeholder",
            "restored   C 1.0 (com.c) as a demoted placeholder",
            "restored   D 1.0 (com.d) as a demoted placeholder",
            "installed  A 1.0 (com.a)",
            "installed  B 1.0 (com.b)",
            f"skipped    C 1.0 (com.c): {DEMOTED}",
            f"skipped    D 1.0 (com.d): {DEMOTED}",
            "done       2 installed, 2 skipped"])
        self.assertEqual(self.run_appsync("--quiet", "restore", self.backup), ("", ""))

    def make_large(self):
        """An application that takes a while to send."""
        self.offer("com.b", body=support.noise(30_000_000), ending=".tar", name="Big" * 60)
        (self.library / "com.b.zip").unlink()

    def test_interrupted_while_the_store_sends(self):
        self.make_large()
        self.use("new")
        process = self.start_restore("--store", self.library)
        for line in process.stdout:
            event = json.loads(line)
            if event["event"] == "transfer" and event["identifier"] == "com.b":
                break
        process.send_signal(signal.SIGINT)
        events = [json.loads(line) for line in self.rest(process)[0].splitlines()]
        self.assertEqual(process.returncode, 130)
        self.assertEqual(self.reasons(events[-1]["failed"]),
                         {"com.b": "interrupted; the next restore does it"})
        self.assertEqual(events[-1]["installed"], ["com.a"])
        self.assertEqual(self.restore("--store", self.library)["installed"], ["com.b"])

    def test_a_reader_that_goes_away_does_not_stop_the_restore(self):
        self.use("new")
        process = self.start_restore("--store", self.library)
        process.stdout.close()
        error = process.stderr.read()
        self.assertEqual(process.wait(60), 0)
        self.assertIn("nobody reads the output", error)
        self.assertEqual(self.apps()["com.a"], "1.0")


class CoordinatedRestores(Restores):
    coordination = "on"

    def test_a_demoted_application_comes_when_it_is_asked_for(self):
        self.use("new")
        self.restore("--store", self.library)
        self.run_appsync("tap", "com.c")
        summary = self.restore()
        self.assertEqual(self.reasons(summary["skipped"])["com.c"], "waits for its package")
        self.assertEqual(self.restore("--store", self.library)["installed"], ["com.c"])
        self.assertEqual(self.notes("com.c"), "notes of com.c")
        self.assertEqual(self.apps(),
                         {"com.a": "1.0", "com.b": "1.0", "com.c": "1.0", "com.d?": "1.0"})

    def test_packages_are_left_to_the_store(self):
        self.use("new")
        before = self.phone_tree()
        [error] = self.json_lines("restore", self.backup, "--packages", self.library, code=2)
        self.assertIn("use --store", error["message"])
        self.assertEqual(self.phone_tree(), before)


class Packages(RestoreCase):
    """The host itself brings the packages; their data part follows."""

    def remembered(self):
        file = self.phone / "root/var/mobile/Library/ApplicationSync/RestoreState.plist"
        return sorted(plistlib.loads(file.read_bytes())) if file.exists() else []

    def staged(self):
        staging = self.phone / "root/var/mobile/Media/PublicStaging"
        return sorted(path.name for path in staging.iterdir()) if staging.exists() else []

    def test_all_come_with_their_data(self):
        self.use("new")
        self.assertEqual(self.restore("--packages", self.library)["installed"], ["com.a", "com.b"])
        self.assertEqual(self.notes("com.a"), "notes of com.a")
        self.assertEqual((self.remembered(), self.staged()), ([], []))

    def kill_when_sent(self):
        """com.a's package has come and is remembered; com.b's is on its way."""
        self.offer("com.b", body=support.noise(30_000_000), ending=".tar", name="Big" * 60)
        (self.library / "com.b.zip").unlink()
        self.use("new")
        process = self.start("--json", "restore", self.backup, "--packages", self.library)
        for line in process.stdout:
            event = json.loads(line)
            if event["event"] == "transfer" and event["identifier"] == "com.b":
                break
        process.kill()
        process.communicate()
        self.assertEqual(self.remembered(), ["com.a"])
        self.assertIn("com.a.zip", self.staged())

    def test_a_remembered_package_is_not_sent_again(self):
        self.kill_when_sent()
        self.assertEqual(self.restore("--packages", self.library)["installed"], ["com.a", "com.b"])
        self.assertNotIn("com.a", [event["identifier"] for event in self.events
                                   if event["event"] == "transfer"])
        self.assertEqual(self.notes("com.a"), "notes of com.a")
        self.assertEqual((self.remembered(), self.staged()), ([], []))

    def test_a_remembered_package_that_is_gone_is_sent_anew(self):
        self.kill_when_sent()
        (self.phone / "root/var/mobile/Media/PublicStaging/com.a.zip").unlink()
        self.assertEqual(self.restore("--packages", self.library)["installed"], ["com.a", "com.b"])
        self.assertIn("com.a", [event["identifier"] for event in self.events
                                if event["event"] == "transfer"])
        self.assertEqual(self.notes("com.a"), "notes of com.a")
        self.assertEqual((self.remembered(), self.staged()), ([], []))

    def test_what_the_library_lacks_waits(self):
        (self.library / "com.a.zip").unlink()
        self.use("new")
        summary = self.restore("--packages", self.library)
        self.assertEqual(self.reasons(summary["skipped"])["com.a"],
                         "the library does not have it")


class Refusals(support.Case):
    def setUp(self):
        super().setUp()
        self.init()

    def check_refused(self, reason, *arguments):
        before = self.phone_tree()
        [error] = self.json_lines("restore", *arguments, code=2)
        self.assertEqual(error["event"], "error")
        self.assertIn(reason, error["message"])
        self.assertEqual(self.phone_tree(), before)

    def test_no_backup(self):
        self.check_refused("there is no such folder", self.folder / "nothing")
        self.check_refused("it is no backup", self.library)

    def test_a_damaged_list(self):
        backup = self.folder / "backup"
        self.run_appsync("backup", backup)
        (backup / "RestoreApplications.plist").write_bytes(b"damaged")
        self.check_refused("RestoreApplications.plist", backup)

    def test_no_library(self):
        backup = self.folder / "backup"
        self.run_appsync("backup", backup)
        for option in ("--store", "--packages"):
            self.check_refused("cannot read the library", backup, option, self.folder / "nothing")

    def test_usage_and_phone(self):
        self.run_appsync("restore", code=2)
        backup = self.folder / "backup"
        self.run_appsync("backup", backup)
        self.environment["APPSYNC_DEVICE"] = str(self.folder / "no phone")
        self.run_appsync("restore", backup, code=3)


if __name__ == "__main__":
    support.main()
