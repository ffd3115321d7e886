"""Backups: what they hold, what they leave alone, and how they end early."""

import hashlib
import json
import plistlib
import resource
import signal
import tarfile

import support

MB = 1_000_000
DATA = "root/var/mobile/Containers/Data"
# Makes each event long, so that a backup waits for whoever reads them.
LONG_NAME = "Big" * 2000


class BackupCase(support.Case):
    def setUp(self):
        super().setUp()
        self.init(*self.options())
        self.target = self.folder / "backups" / "phone"
        self.target.parent.mkdir()

    def options(self):
        return ()

    def backup(self, *arguments, code=0):
        """A whole backup; its summary."""
        events = self.json_lines("backup", *(arguments or (self.target,)), code=code)
        self.check_events(events, "backup-summary")
        self.events = events
        return events[-1]

    def put_data(self, identifier, name="file", contents=b"contents"):
        file = self.phone / DATA / identifier / name
        file.parent.mkdir(parents=True, exist_ok=True)
        file.write_bytes(contents)

    def container(self, identifier):
        [app] = [app for app in self.json_lines("apps") if app["identifier"] == identifier]
        return (self.phone / "root" / app["path"].lstrip("/")).parent

    def list(self, name="RestoreApplications.plist"):
        return plistlib.loads((self.target / name).read_bytes())

    def metadata(self, identifier):
        return plistlib.loads(self.list()[identifier]["HalvoMetadata"])

    @staticmethod
    def tree(folder):
        return {str(path.relative_to(folder)): path.read_bytes() if path.is_file() else None
                for path in folder.rglob("*")}

    def beside(self):
        return sorted(path.name for path in self.target.parent.iterdir())

    def check_digests(self):
        manifest = self.list("Manifest.plist")["Files"]
        files = {name: contents for name, contents in self.tree(self.target).items()
                 if contents is not None and name != "Manifest.plist"}
        self.assertEqual(set(manifest), set(files))
        for name, contents in files.items():
            self.assertEqual(manifest[name], {
                "Size": len(contents), "SHA256": hashlib.sha256(contents).hexdigest()})


class Backups(BackupCase):
    def fill(self):
        for identifier in ("com.a", "com.b", "com.c"):
            self.offer(identifier)
        layout = self.folder / "layout"
        layout.write_text("com.c\ncom.a\ncom.b\n")
        self.sync("--icon-layout", layout)
        self.put_data("com.a", "Documents/notes", b"notes")
        (self.phone / DATA / "com.a/latest").symlink_to("Documents/notes")
        self.put_data("com.b", "large", support.noise(3 * MB))

    def test_holds_what_the_applications_come_back_from(self):
        self.fill()
        summary = self.backup()
        self.assertEqual(summary, {"event": "summary", "failed": [],
                                   "saved": ["com.a", "com.b", "com.c"]})
        self.check_digests()
        self.assertEqual(sorted(self.list()), ["com.a", "com.b", "com.c"])
        self.assertEqual(self.metadata("com.a"), {"bundleVersion": "1.0", "title": "A"})
        self.assertEqual(self.list("IconState.plist"), ["com.c", "com.a", "com.b"])
        self.assertEqual(self.list("DemotedApps.plist"),
                         {"AutomaticDowngrades": [], "IntentionalDowngrades": []})
        self.assertEqual([path.name for path in sorted((self.target / "Data").iterdir())],
                         ["com.a.tar", "com.b.tar"])

    def test_other_tools_read_the_data(self):
        self.fill()
        self.backup()
        with tarfile.open(self.target / "Data/com.a.tar") as archive:
            self.assertEqual([(item.name, item.type) for item in archive],
                             [("Documents", tarfile.DIRTYPE), ("Documents/notes", tarfile.REGTYPE),
                              ("latest", tarfile.SYMTYPE)])
            self.assertEqual(archive.extractfile("Documents/notes").read(), b"notes")
            self.assertEqual({(item.uid, item.gid, item.uname, item.gname) for item in archive},
                             {(0, 0, "", "")})

    def test_twice_gives_the_same_bytes(self):
        self.fill()
        self.backup()
        again = self.target.with_name("again")
        self.backup(again)
        first = self.tree(self.target)
        self.assertEqual(self.tree(again), first)
        self.backup()
        self.assertEqual(self.tree(self.target), first)
        self.assertEqual(self.beside(), ["again", "phone"])

    def test_the_client_prepares_the_metadata(self):
        self.fill()
        metadata = {"bundleVersion": "1.0", "itemName": "A", "is-auto-download": True, "x": 1}
        (self.container("com.a") / "HalvoMetadata.plist").write_bytes(plistlib.dumps(metadata))
        self.backup()
        del metadata["is-auto-download"]
        self.assertEqual(self.metadata("com.a"), metadata)
        prepared = (self.container("com.a") / "HalvoMetadata.plist").read_bytes()
        self.assertEqual(plistlib.loads(prepared), metadata)

    def test_no_file_of_the_phone_changes(self):
        self.fill()
        before = self.phone_tree()
        self.backup()
        after = self.phone_tree()
        self.assertEqual({name for name in {*before, *after}
                          if before.get(name) != after.get(name)}, set())

    def test_an_application_whose_data_cannot_be_saved_fails_alone(self):
        self.fill()
        (self.phone / DATA / "com.a" / "/".join("d" * 201)).mkdir(parents=True)
        summary = self.backup(code=1)
        self.assertEqual(summary["saved"], ["com.b", "com.c"])
        [failed] = summary["failed"]
        self.assertEqual(failed["identifier"], "com.a")
        self.assertIn("its data cannot be saved: ", failed["reason"])
        self.assertIn("File name too long", failed["reason"])
        self.assertEqual(sorted(self.list()), ["com.b", "com.c"])
        self.check_digests()

    def test_an_older_backup_that_holds_what_cannot_be_saved_stays(self):
        self.fill()
        self.backup()
        older = self.tree(self.target)
        (self.phone / DATA / "com.a" / "/".join("d" * 201)).mkdir(parents=True)
        summary = self.backup(code=1)
        self.assertEqual((summary["saved"], [entry["identifier"] for entry in summary["failed"]]),
                         ([], ["com.a"]))
        self.assertEqual(self.events[-2], {
            "event": "error", "message": "the older backup stays, since com.a cannot be saved now; "
                                         "--allow-missing replaces it all the same"})
        self.assertEqual(self.tree(self.target), older)
        self.assertEqual(self.beside(), ["phone"])
        summary = self.backup("--allow-missing", self.target, code=1)
        self.assertEqual(summary["saved"], ["com.b", "com.c"])
        self.assertEqual(sorted(self.list()), ["com.b", "com.c"])

    def test_an_older_backup_stays_while_the_phone_has_data_that_it_does_not_list(self):
        self.fill()
        self.backup()
        older = self.tree(self.target)
        for identifier in ("com.a", "com.b"):
            self.run_appsync("uninstall", identifier)
        self.put_data("com.a")
        self.put_data("com.unknown")
        summary = self.backup(code=1)
        self.assertEqual(summary["failed"], [
            {"identifier": "com.a", "reason": "the phone does not list it, but has data of it"}])
        self.assertEqual(self.events[-2]["event"], "error")
        self.assertEqual(self.tree(self.target), older)
        self.backup("--allow-missing", self.target)
        self.assertEqual(sorted(self.list()), ["com.c"])
        self.backup()

    def test_plain_lines(self):
        self.fill()
        self.assertEqual(self.run_appsync("backup", self.target), ("done       3 saved\n", ""))
        self.assertEqual(self.run_appsync("--quiet", "backup", self.target), ("", ""))
        out, _ = self.run_appsync("--verbose", "backup", self.target)
        self.assertIn("saved      A (com.a)\n", out)
        self.assertIn("preparing for backup", out)

    def test_quiet_tells_failures(self):
        self.fill()
        (self.phone / DATA / "com.a" / "/".join("d" * 201)).mkdir(parents=True)
        out, err = self.run_appsync("--quiet", "backup", self.target, code=1)
        self.assertEqual(out, "")
        self.assertIn("appsync: failed com.a: its data cannot be saved", err)

    def test_a_phone_without_applications(self):
        self.assertEqual(self.backup()["saved"], [])
        self.check_digests()


class CoordinatedBackups(Backups):
    def options(self):
        return ("--coordination", "on")


class Refusals(BackupCase):
    def refusal(self, *arguments, code):
        [error] = self.json_lines("backup", *arguments, code=code)
        self.assertEqual(error["event"], "error")
        return error["message"]

    def test_what_is_no_backup_is_not_replaced(self):
        self.target.mkdir()
        (self.target / "thesis.txt").write_text("years of work")
        self.assertIn("it is not empty", self.refusal(self.target, code=2))
        self.assertIn("it is no folder", self.refusal(self.target / "thesis.txt", code=2))
        self.assertEqual((self.target / "thesis.txt").read_text(), "years of work")

    def test_what_a_person_put_into_a_backup_is_not_lost(self):
        self.backup()
        (self.target / "notes.txt").write_text("mine")
        self.assertIn("\"notes.txt\"", self.refusal(self.target, code=2))
        self.assertEqual((self.target / "notes.txt").read_text(), "mine")

    def test_the_folder_around_must_exist(self):
        self.assertIn("No such file or directory",
                      self.refusal(self.folder / "missing" / "phone", code=2))

    def test_a_place_that_takes_no_files(self):
        self.assertIn("cannot write the backup /proc/phone", self.refusal("/proc/phone", code=3))

    def test_wrong_usage_and_a_missing_phone(self):
        self.refusal(code=2)
        self.environment["APPSYNC_DEVICE"] = str(self.folder / "nowhere")
        self.refusal(self.target, code=3)
        self.assertEqual(self.beside(), [])


class EarlyEnds(BackupCase):
    def setUp(self):
        super().setUp()
        self.offer("com.a")
        self.sync()
        self.put_data("com.a")
        self.backup()
        self.older = self.tree(self.target)
        bundle = self.bundle("com.big", KBBundleDisplayName=LONG_NAME)
        self.run_appsync("package", bundle, "-o", self.library / "com.big.zip")
        self.offer("com.c")
        self.sync()
        self.put_data("com.big", contents=support.noise(30 * MB))

    def start_backup(self, events):
        """A backup that has told so many events, and cannot tell all of them unheard."""
        process = self.start("--json", "backup", self.target)
        for _ in range(events):
            process.stdout.readline()
        return process

    def check_next(self):
        """The next backup makes everything good."""
        self.assertEqual(self.tree(self.target), self.older)
        self.assertEqual(self.backup()["saved"], ["com.a", "com.big", "com.c"])
        self.assertEqual(self.beside(), ["phone"])
        self.check_digests()

    def test_interrupted(self):
        for number in (signal.SIGINT, signal.SIGTERM):
            process = self.start_backup(5)
            process.send_signal(number)
            out, err = self.rest(process)
            events = [json.loads(line) for line in out.splitlines()]
            self.assertEqual((process.returncode, err), (130, ""))
            self.assertIn({"event": "interrupted"}, events)
            self.assertEqual(events[-1], {"event": "summary", "saved": [], "failed": []})
            self.assertEqual(self.beside(), ["phone"])
        self.check_next()

    def test_interrupted_tells_people(self):
        self.put_data("com.c", contents=support.noise(60 * MB))
        process = self.start("backup", self.target, "--verbose")
        process.stdout.readline()
        process.send_signal(signal.SIGINT)
        out, _ = self.rest(process)
        self.assertEqual(process.returncode, 130)
        self.assertTrue(out.endswith("stopped    no backup was made\n"), out)
        self.put_data("com.c")
        self.check_next()

    def test_killed(self):
        for events in (0, 1, 3, 5, 12, 20):
            process = self.start_backup(events)
            process.kill()
            process.communicate()
            self.assertEqual(self.tree(self.target), self.older)
        self.assertEqual(len(self.beside()), 2, "what a killed backup left goes with the next")
        self.check_next()

    def test_a_full_disk(self):
        """Files of more than 20 MB cannot be written."""
        def limit():
            resource.setrlimit(resource.RLIMIT_FSIZE, (20 * MB, resource.RLIM_INFINITY))
        out, _ = self.run_appsync("--json", "backup", self.target, code=1, preexec_fn=limit)
        events = [json.loads(line) for line in out.splitlines()]
        self.assertIn("com.big.tar: File too large", events[-2]["message"])
        self.assertEqual(events[-1], {"event": "summary", "saved": [], "failed": []})
        self.assertEqual(self.beside(), ["phone"])
        self.check_next()

    def test_the_phone_is_busy_meanwhile(self):
        process = self.start_backup(3)
        [error] = self.json_lines("backup", self.folder / "other", code=3)
        self.assertEqual(error["event"], "error")
        out, _ = self.rest(process)
        self.assertEqual(process.returncode, 0, out)

    def test_a_reader_that_goes_away_does_not_stop_the_backup(self):
        process = self.start("--json", "backup", self.target)
        process.stdout.close()
        error = process.stderr.read()
        self.assertEqual(process.wait(60), 0)
        self.assertIn("nobody reads the output", error)
        self.check_digests()
        self.assertEqual(len(self.list()), 3)


if __name__ == "__main__":
    support.main()
