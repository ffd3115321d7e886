"""Whole syncs of real packages with a real device and the real plug-in."""

import os
import pathlib
import plistlib
import shutil
import subprocess

import support


def reasons(entries):
    return {entry["identifier"]: entry["reason"] for entry in entries}


class Sync(support.Case):
    def setUp(self):
        super().setUp()
        self.init()

    def test_life_of_applications(self):
        self.offer("com.a")
        self.offer("com.b")
        summary = self.sync()
        self.assertEqual(summary["installed"], ["com.a", "com.b"])
        self.assertEqual(self.apps(), {"com.a": "1.0", "com.b": "1.0"})

        self.assertEqual(reasons(self.sync()["skipped"]),
                         {"com.a": "version 1.0 is installed", "com.b": "version 1.0 is installed"})

        self.offer("com.a", "1.10")
        self.assertEqual(self.sync()["updated"], ["com.a"])
        self.assertEqual(self.apps(), {"com.a": "1.10", "com.b": "1.0"})

        package = self.offer("com.c")
        self.assertEqual(self.sync("--remove", "com.b", "--remove", "com.c")["deleted"], ["com.b"])
        self.assertEqual(self.apps(), {"com.a": "1.10"})
        self.assertEqual(reasons(self.events[-1]["skipped"])["com.c"], "it is not installed")

        package.unlink()
        before = self.phone_tree()
        [error] = self.json_lines("sync", self.library, "--remove", "com.c", code=2)
        self.assertIn("com.c is neither on the phone nor in", error["message"])
        self.assertEqual(self.phone_tree(), before)
        self.assertEqual(self.sync()["installed"], ["com.b"])
        out, _ = self.run_appsync("sync", self.library)
        self.assertEqual(out, "done       nothing to do: 2 up to date\n")
        out, _ = self.run_appsync("sync", self.library, "--dry-run")
        self.assertEqual(out, "done       nothing to do: 2 up to date\n")

    def test_a_downgrade_is_told_as_one(self):
        self.offer("com.a", "2.0")
        self.sync()
        self.offer("com.a", "1.0")
        out, _ = self.run_appsync("sync", self.library, "--install", "com.a")
        self.assertEqual(out, "downgraded A 1.0 (com.a)\ndone       1 downgraded\n")

    def test_installs_only_what_is_named_also_anew(self):
        self.offer("com.a")
        self.offer("com.b")
        self.assertEqual(self.sync("--install", "com.b")["installed"], ["com.b"])
        self.assertEqual(self.sync("--install", "com.b")["updated"], ["com.b"])
        self.assertEqual(self.apps(), {"com.b": "1.0"})

    def test_mirror(self):
        extra = self.offer("com.extra")
        self.offer("com.kept")
        self.sync()
        extra.unlink()
        self.assertEqual(self.sync()["deleted"], [])
        self.assertEqual(self.sync("--mirror")["deleted"], ["com.extra"])
        self.assertEqual(self.apps(), {"com.kept": "1.0"})

    def test_reports_what_a_person_deleted(self):
        package = self.offer("com.a")
        self.sync()
        self.run_appsync("uninstall", "com.a")
        package.unlink()
        self.sync()
        self.assertIn({"event": "deleted-on-phone", "identifier": "com.a"}, self.events)
        self.sync()
        self.assertNotIn({"event": "deleted-on-phone", "identifier": "com.a"}, self.events)

    def test_what_is_installed_runs(self):
        self.offer("com.a", body=support.noise(1_000_000))
        self.sync()
        path = self.json_lines("apps")[0]["path"]
        bundle = self.phone / "root" / path.lstrip("/")
        self.assertEqual(subprocess.check_output([bundle / "run"], text=True), "hello\n")
        self.assertEqual((bundle / "body").read_bytes(), support.noise(1_000_000))

    def test_icon_layout_is_the_order_of_sending(self):
        for version in ("1.0", "2.0"):
            for identifier in ("com.a", "com.b", "com.c"):
                self.offer(identifier, version)
            if version == "1.0":
                self.sync()
        layout = self.folder / "layout.txt"
        layout.write_text("com.c\ncom.a\n")
        self.sync("--icon-layout", layout)
        self.assertEqual([event["identifier"] for event in self.events
                          if event["event"] == "transfer-ended"], ["com.c", "com.a", "com.b"])

    def test_dry_run_changes_nothing(self):
        self.offer("com.a")
        self.sync()
        self.offer("com.a", "2.0")
        self.offer("com.new")
        before = self.phone_tree(), self.apps(), self.json_lines("history", "--records"), self.json_lines("log")
        summary = self.sync("--dry-run")
        after = self.phone_tree(), self.apps(), self.json_lines("history", "--records"), self.json_lines("log")
        self.assertEqual(before, after)
        self.assertEqual([(event["action"], event["identifier"]) for event in self.events
                          if event["event"] == "plan"],
                         [("update", "com.a"), ("install", "com.new")])
        self.assertEqual(summary["installed"] + summary["updated"], [])
        out, _ = self.run_appsync("sync", self.library, "--dry-run")
        self.assertIn("update     A 2.0 (com.a) from 1.0\n", out)

    def test_restrictions(self):
        package = self.offer("com.a")
        self.sync()
        self.offer("com.b")
        self.run_appsync("policy", "--installing", "forbid")
        summary = self.sync("--remove", "com.a")
        self.assertEqual(summary["deleted"], ["com.a"])
        self.assertIn("forbidden", reasons(summary["skipped"])["com.b"])

        self.run_appsync("policy", "--installing", "allow", "--removing", "forbid")
        package.unlink()
        self.assertEqual(self.sync()["installed"], ["com.b"])
        [refused] = self.sync("--remove", "com.b", code=1)["failed"]
        self.assertEqual(refused["identifier"], "com.b")
        self.assertIn("forbidden", refused["reason"])
        self.assertNotIn("file", refused)

        self.run_appsync("policy", "--installing", "forbid")
        self.offer("com.c")
        self.assertIn("forbidden", reasons(self.sync()["skipped"])["com.c"])
        for arguments in (("--install", "com.c"), ("--install", "com.c", "--dry-run")):
            summary = self.sync(*arguments, code=1)
            self.assertIn("forbidden", reasons(summary["failed"])["com.c"])
            self.assertEqual(summary["failed"][0]["file"], "com.c.zip")
        self.assertEqual(self.apps(), {"com.b": "1.0"})

    def test_status_tells_all(self):
        self.offer("com.a", body=support.noise(50_000))
        self.sync()
        self.run_appsync("launch", "com.a")
        status = self.json_lines("status")[0]
        self.assertEqual(status["todo"], {"INSTALLED": 1})
        self.assertEqual(status["applications"]["count"], 1)
        self.assertGreater(status["applications"]["physicalSize"], 50_000)
        self.assertEqual(status["foreground"], ["com.a"])
        self.assertEqual(status["policy"], {"installing": "allow", "removing": "allow"})
        self.run_appsync("quit", "com.a")
        self.run_appsync("uninstall", "com.a")
        self.assertEqual(self.json_lines("status")[0]["uninstalled"], ["com.a"])

    def test_history_and_log(self):
        self.offer("com.a")
        self.sync()
        records = self.json_lines("history", "--records")
        self.assertEqual({record["identifier"] for record in records}, {"com.a"})
        self.assertEqual(self.json_lines("history", "--records", "--limit", "1"), records[-1:])
        lines = self.json_lines("log")
        self.assertEqual(set(lines[0]), {"time", "channel", "level", "text"})
        self.assertTrue(lines[-1]["text"].startswith("com.corvane.twc.AppsClient|"))
        self.assertEqual(self.json_lines("log", "--limit", "3"), lines[-3:])
        self.assertTrue(all(line["level"] in ("error", "fault")
                            for line in self.json_lines("log", "--level", "error")))

    def test_verbose_shows_the_clients_log(self):
        self.sync("--verbose")
        self.assertTrue(any(event["event"] == "log" and "sync ended with success: y" in
                            event["text"] for event in self.events))

    def test_clear_forgets_the_sync(self):
        self.offer("com.a")
        self.sync()
        self.run_appsync("clear")
        self.assertFalse((self.phone / "root/var/mobile/Library/ApplicationSync").exists())
        self.assertEqual(self.apps(), {"com.a": "1.0"})
        self.offer("com.b")
        self.assertEqual(self.sync()["installed"], ["com.b"])

    def test_clear_takes_sent_packages_along(self):
        library = self.phone / "root/var/mobile/Library/ApplicationSync/HalvoStuff"
        media = self.phone / "root/var/mobile/Media"
        for folder in (library, media / "PublicStaging", media / "Downloads"):
            folder.mkdir(parents=True, exist_ok=True)
        (library / "ApplicationsSync.plist").write_bytes(
            plistlib.dumps([{"identifier": "com.sent", "operation": "DOWNLOADED"}]))
        for folder in ("PublicStaging", "Downloads"):
            (media / folder / "com.sent.zip").write_text("sent")
            (media / folder / "holiday.zip").write_text("a person's own")
        self.run_appsync("clear")
        self.assertEqual(sorted(str(path.relative_to(media)) for path in media.rglob("*.zip")),
                         ["Downloads/holiday.zip", "PublicStaging/holiday.zip"])

    def test_an_account_other_than_root_may_sync(self):
        if os.getuid() != 0:
            self.skipTest("only root can become somebody else")
        self.offer("com.a")
        # A copy, since that account may not get at a clone in a home folder.
        built = pathlib.Path(support.APPSYNC)
        command = shutil.copy(built, self.folder)
        shutil.copytree(built.parent / "AppsClient.syncplugin",
                        self.folder / "AppsClient.syncplugin")
        shutil.chown(self.folder, 65534)
        for path in self.folder.rglob("*"):
            os.chown(path, 65534, 65534)
        out, _ = self.run_appsync("sync", self.library, executable=command, user=65534, group=65534)
        self.assertIn("1 installed", out)


class Mending(support.Case):
    """What is on the phone, and yet is not as it should be, with and without coordinators."""

    def root(self):
        return self.phone / "root"

    def check_lost_executable(self, *options):
        self.init(*options)
        self.offer("com.a")
        self.offer("com.b")
        self.sync()
        path = next(app["path"] for app in self.json_lines("apps") if app["identifier"] == "com.a")
        (self.root() / path.lstrip("/") / "run").unlink()
        self.run_appsync("launch", "com.a", code=1)
        out, _ = self.run_appsync("sync", self.library, "--dry-run")
        self.assertEqual(out, "reinstall  A 1.0 (com.a)\n")
        summary = self.sync()
        self.assertEqual(summary["updated"], ["com.a"])
        self.assertEqual([entry["identifier"] for entry in summary["skipped"]], ["com.b"])
        self.run_appsync("launch", "com.a")

    def test_an_application_without_its_executable_is_installed_anew(self):
        self.check_lost_executable()

    def test_an_application_without_its_executable_is_installed_anew_where_coordinated(self):
        self.check_lost_executable("--coordination", "on")

    def check_untold_install(self, *options):
        self.init(*options)
        self.offer("com.a")
        self.offer("com.b")
        self.sync()
        # As a kill leaves it between the install and the word of it.
        list_file = self.root() / "var/mobile/Library/ApplicationSync/HalvoStuff/ApplicationsSync.plist"
        todo = plistlib.loads(list_file.read_bytes())
        for entry in todo:
            if entry["identifier"] == "com.a":
                entry["operation"] = "DOWNLOADED"
        list_file.write_bytes(plistlib.dumps(todo))
        out, _ = self.run_appsync("sync", self.library, "--dry-run")
        self.assertEqual(out, "install    A 1.0 (com.a)\n")
        out, _ = self.run_appsync("sync", self.library)
        self.assertEqual(out, "installed  A 1.0 (com.a)\n"
                              "done       1 installed, 1 up to date\n")
        self.assertEqual(self.sync()["installed"], [])

    def test_an_install_that_a_kill_left_untold_is_told_once(self):
        self.check_untold_install()

    def test_an_install_that_a_kill_left_untold_is_told_once_where_coordinated(self):
        self.check_untold_install("--coordination", "on")


class OddPackages(support.Case):
    def setUp(self):
        super().setUp()
        self.init()

    def test_a_damaged_package_harms_no_other(self):
        self.offer("com.good")
        package = self.offer("com.bad", body=support.noise(200_000))
        contents = bytearray(package.read_bytes())
        contents[100_000:100_100] = b"\0" * 100
        package.write_bytes(contents)
        summary = self.sync(code=1)
        self.assertEqual(summary["installed"], ["com.good"])
        self.assertEqual(list(reasons(summary["failed"])), ["com.bad"])
        self.assertEqual([event["file"] for event in self.events
                          if event["event"] == "install-ended" and not event["success"]],
                         ["com.bad.zip"])
        self.assertEqual(self.apps(), {"com.good": "1.0"})

        self.offer("com.bad", "1.1")
        self.assertEqual(self.sync()["installed"], ["com.bad"])

    def test_a_damaged_update_keeps_the_old_version(self):
        self.offer("com.a")
        self.sync()
        package = self.offer("com.a", "2.0", body=support.noise(200_000))
        package.write_bytes(package.read_bytes()[:150_000])
        summary = self.sync(code=1)
        self.assertEqual([entry["identifier"] for entry in summary["failed"]], ["com.a"])
        self.assertEqual(self.apps(), {"com.a": "1.0"})

    def test_a_damaged_update_without_a_name_keeps_the_old_version(self):
        self.offer("com.a")
        self.sync()
        described = {**support.info("com.a", "2.0"), "KBBundleDisplayName": ""}
        self.offer_raw("com.a.zip", {"A.app/Info.plist": plistlib.dumps(described),
                                     "A.app/body": support.noise(200_000)})
        package = self.library / "com.a.zip"
        contents = bytearray(package.read_bytes())
        contents[100_000:100_100] = b"\0" * 100
        package.write_bytes(contents)
        self.assertEqual(list(reasons(self.sync(code=1)["failed"])), ["com.a"])
        self.assertEqual(self.apps(), {"com.a": "1.0"})

    def test_files_that_are_no_packages(self):
        self.offer("com.a")
        (self.library / "broken.zip").write_bytes(b"garbage")
        (self.library / "notes.txt").write_text("buy milk")
        summary = self.sync(code=1)
        self.assertEqual(summary["installed"], ["com.a"])
        self.assertEqual(reasons(summary["failed"]),
                         {"broken.zip": "it is neither a zip nor a tar archive"})
        self.assertEqual(list(reasons(summary["skipped"])), ["notes.txt"])

    def test_hostile_packages_write_nothing_outside(self):
        good = {"A.app/Info.plist": plistlib.dumps(support.info("com.evil")),
                "A.app/run": "#!/bin/sh\n"}
        for number, entry in enumerate(("../../evil", "/tmp/evil", "A.app/../../evil",
                                        "A.app/INFO.plist", "Other.app/Info.plist")):
            self.offer_raw("evil.zip", {**good, entry: "evil"})
            before = {path for path in self.phone_tree() if "ApplicationSync" not in path}
            summary = self.sync(code=1)
            self.assertEqual(list(reasons(summary["failed"])), ["com.evil"], entry)
            self.assertEqual(self.apps(), {}, entry)
            new = {path for path in self.phone_tree()
                   if "ApplicationSync" not in path and "com.corvane.twc.Apps" not in path} - before
            self.assertFalse([path for path in new if "evil" in path.lower()], entry)

    def test_escape_sequences_in_names_do_not_reach_a_terminal(self):
        self.offer_raw("a.zip", {"A.app/Info.plist": plistlib.dumps(
            support.info("com.a", name="Evil \u009b31m\u202e")), "A.app/run": "#!/bin/sh\n"})
        out, _ = self.run_appsync("sync", self.library)
        apps, _ = self.run_appsync("apps")
        for character in "\x1b\u009b\u202e":
            self.assertNotIn(character, out + apps)

    def test_a_damaged_package_beside_a_whole_one(self):
        whole = self.offer("com.a", body=support.noise(100_000)).read_bytes()
        (self.library / "a-damaged.zip").write_bytes(
            whole[:50_000] + bytes([whole[50_000] ^ 1]) + whole[50_001:])
        summary = self.sync()
        self.assertEqual(summary["installed"], ["com.a"])
        [reason] = [reasons(summary["skipped"])["a-damaged.zip"]]
        self.assertRegex(reason, "^damaged: .*; com.a.zip is used instead$")

    def test_the_highest_version_counts(self):
        for version in ("1.9", "1.10", "1.2"):
            self.run_appsync("package", self.bundle("com.a", version), "-o",
                             self.library / f"a-{version}.zip")
        self.sync()
        self.assertEqual(self.apps(), {"com.a": "1.10"})


class OtherArchivers(support.Case):
    """Packages that people make with what they have."""

    def setUp(self):
        super().setUp()
        self.init()

    def check(self, name, *command):
        if not shutil.which(command[0]):
            self.skipTest(f"{command[0]} is not there")
        bundle = self.bundle("com.packed", body=b"text " * 50_000)
        (bundle.parent / "HalvoMetadata.plist").write_bytes(plistlib.dumps({"itemId": 7}))
        words = [str(self.library / name) if word == "OUT" else word for word in command]
        subprocess.run(words, cwd=bundle.parent, check=True, stdout=subprocess.DEVNULL)
        self.assertEqual(self.sync()["installed"], ["com.packed"], name)
        path = self.phone / "root" / self.json_lines("apps")[0]["path"].lstrip("/")
        self.assertEqual((path / "body").read_bytes(), b"text " * 50_000)
        self.assertTrue((path.parent / "HalvoMetadata.plist").exists())

    def test_info_zip(self):
        self.check("a.zip", "zip", "-qr", "OUT", ".")

    def test_seven_zip(self):
        self.check("a.zip", "7zz" if shutil.which("7zz") else "7z", "a", "-tzip", "-bso0", "OUT", "Packed.app", "HalvoMetadata.plist")

    def test_python_zipfile(self):
        self.check("a.zip", "python3", "-m", "zipfile", "-c", "OUT", "Packed.app",
                   "HalvoMetadata.plist")

    def test_tar_gz(self):
        self.check("a.tar.gz", "tar", "-czf", "OUT", ".")

    def test_tar_xz(self):
        self.check("a.tar.xz", "tar", "-cJf", "OUT", "Packed.app", "HalvoMetadata.plist")

    def test_tar_zst(self):
        self.check("a.tar.zst", "tar", "--zstd", "-cf", "OUT", ".")


if __name__ == "__main__":
    support.main()
