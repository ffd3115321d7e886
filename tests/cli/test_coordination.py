"""A person who taps or cancels what a sync in another process is installing."""

import json

import support

BIG = 30_000_000
# Makes each of its events long, so that its sending waits for whoever reads them.
LONG_NAME = "Big" * 60


class TapAndCancel(support.Case):
    def setUp(self):
        super().setUp()
        self.init("--coordination", "on")
        self.offer("com.a-big", body=support.noise(BIG), ending=".tar", name=LONG_NAME)
        for name in ("com.b", "com.c", "com.d"):
            self.offer(name)

    def sync_until_sending(self):
        """A sync that has begun to send the big package."""
        process = self.start("--json", "sync", self.library)
        for line in process.stdout:
            event = json.loads(line)
            if event["event"] == "transfer":
                self.assertEqual(event["identifier"], "com.a-big")
                self.assertLess(event["sent"], event["total"])
                return process
        self.fail("the sync sent nothing: " + process.stderr.read())

    def rest_of_events(self, process, code):
        out, err = self.rest(process)
        self.assertEqual((process.returncode, err), (code, ""), out)
        return [json.loads(line) for line in out.splitlines()]

    def test_a_cancelled_application_is_not_installed_and_harms_no_other(self):
        process = self.sync_until_sending()
        self.assertEqual(self.json_lines("cancel", "com.a-big"),
                         [{"event": "cancelled", "identifier": "com.a-big"}])
        events = self.rest_of_events(process, 1)
        summary = events[-1]
        self.assertEqual(summary["failed"],
                         [{"identifier": "com.a-big", "reason": "cancelled on the phone",
                           "file": "com.a-big.tar"}])
        self.assertEqual(summary["installed"], ["com.b", "com.c", "com.d"])
        self.assertEqual(sum(event["event"] == "transfer-ended" and
                             event["identifier"] == "com.a-big" for event in events), 1)
        self.assertEqual(self.apps(), {"com.b": "1.0", "com.c": "1.0", "com.d": "1.0"})
        self.assertEqual(self.sync()["installed"], ["com.a-big"])

    def test_a_cancelled_application_that_waits_is_never_sent(self):
        process = self.sync_until_sending()
        self.run_appsync("cancel", "com.c")
        events = self.rest_of_events(process, 1)
        self.assertEqual([entry["identifier"] for entry in events[-1]["failed"]], ["com.c"])
        self.assertEqual(events[-1]["installed"], ["com.a-big", "com.b", "com.d"])
        self.assertNotIn("com.c", [event["identifier"] for event in events
                                   if event["event"] == "transfer"])

    def test_a_tapped_application_is_sent_next(self):
        process = self.sync_until_sending()
        self.assertEqual(self.json_lines("tap", "com.d"),
                         [{"event": "tapped", "identifier": "com.d"}])
        events = self.rest_of_events(process, 0)
        ended = [event["identifier"] for event in events if event["event"] == "transfer-ended"]
        self.assertEqual(ended, ["com.d", "com.a-big", "com.b", "com.c"])
        self.assertEqual(len(self.apps()), 4)

    def test_a_package_that_waits_for_its_application_to_be_closed_can_be_cancelled(self):
        self.sync()
        self.run_appsync("launch", "com.b")
        self.offer("com.b", "2.0")
        process = self.start("--json", "sync", self.library)
        for line in process.stdout:
            if json.loads(line)["event"] == "waiting":
                break
        self.run_appsync("cancel", "com.b")
        summary = self.rest_of_events(process, 1)[-1]
        self.assertEqual(summary["failed"], [{
            "identifier": "com.b", "reason": "the install of com.b was cancelled on the phone",
            "file": "com.b.zip"}])
        self.assertEqual((summary["installed"], summary["updated"]), ([], []))
        self.assertEqual(len(self.apps()), 4)
        self.assertEqual(self.apps()["com.b"], "1.0")

    def test_a_clear_does_not_wait_for_an_application_to_be_closed(self):
        self.offer("com.open")
        self.sync("--install", "com.open")
        self.run_appsync("launch", "com.open")
        self.offer("com.open", "2.0")
        process = self.start("--json", "sync", self.library, "--install", "com.open")
        for line in process.stdout:
            if json.loads(line)["event"] == "waiting":
                break
        process.kill()
        process.communicate()
        self.run_appsync("clear")
        self.assertEqual(self.apps()["com.open"], "1.0")

    def test_what_a_killed_sync_left_can_be_cancelled(self):
        process = self.sync_until_sending()
        process.kill()
        process.communicate()
        self.run_appsync("cancel", "com.a-big")
        self.assertNotIn("com.a-big?", self.apps())
        self.assertIn("com.a-big is not being installed",
                      self.run_appsync("cancel", "com.a-big", code=1)[1])


class Demotion(support.Case):
    def check_demoted_application(self, *options):
        self.init(*options)
        self.offer("com.a")
        self.sync()
        self.assertEqual(self.json_lines("demote", "com.a"),
                         [{"event": "demoted", "identifier": "com.a"}])
        self.assertEqual(self.apps(), {"com.a?": "1.0"})
        self.assertEqual(self.json_lines("tap", "com.a"),
                         [{"event": "tapped", "identifier": "com.a"}])
        self.run_appsync("demote", "com.a", code=1)
        self.offer("com.b")
        (self.library / "com.a.zip").rename(self.folder / "com.a.zip")
        self.sync()
        self.assertEqual(self.apps(), {"com.a?": "1.0", "com.b": "1.0"})

    def test_a_demoted_application_can_be_asked_for(self):
        self.check_demoted_application()

    def test_a_demoted_application_can_be_asked_for_where_installs_are_coordinated(self):
        self.check_demoted_application("--coordination", "on")
        (self.folder / "com.a.zip").rename(self.library / "com.a.zip")
        self.sync("--install", "com.a")
        self.assertEqual(self.apps(), {"com.a": "1.0", "com.b": "1.0"})


class Clearing(support.Case):
    coordination = "off"
    data = "root/var/mobile/Containers/Data/com.a"

    def setUp(self):
        super().setUp()
        self.init("--coordination", self.coordination)
        self.offer("com.a")
        self.sync()
        (self.phone / self.data / "notes").write_text("notes")
        self.run_appsync("demote", "com.a")

    def test_a_demoted_application_with_data_is_cleared_only_when_asked(self):
        [error] = self.json_lines("clear", code=1)
        self.assertEqual(error["message"],
                         "nothing is cleared: com.a would lose data that is nowhere else; "
                         "have it installed first, or use --with-data")
        self.assertEqual(self.apps(), {"com.a?": "1.0"})
        self.run_appsync("clear", "--with-data")
        self.assertEqual(self.apps(), {})
        self.assertFalse((self.phone / self.data).exists())

    def test_a_backup_after_a_clear(self):
        backup = self.folder / "backup"
        self.run_appsync("backup", backup)
        self.run_appsync("clear", code=1)
        self.run_appsync("backup", backup)
        self.run_appsync("clear", "--with-data")
        self.run_appsync("restore", backup)
        self.assertEqual(self.apps(), {"com.a?": "1.0"})
        self.assertEqual(
            (self.phone / "root/var/mobile/Media/HalvoRestore/Data/com.a/notes").read_text(),
            "notes")
        self.run_appsync("clear")
        self.assertEqual(self.apps(), {})

    def test_a_mirror_leaves_it_and_says_why(self):
        self.offer("com.b")
        (self.library / "com.a.zip").unlink()
        skipped = self.sync("--mirror")["skipped"]
        self.assertEqual([entry["reason"] for entry in skipped if entry["identifier"] == "com.a"],
                         ["not removed: it waits as a placeholder "
                          "(--remove takes it away with its data)"])
        self.assertEqual(self.sync("--mirror", "--remove", "com.a")["deleted"], ["com.a"])
        self.assertFalse((self.phone / self.data).exists())


class CoordinatedClearing(Clearing):
    coordination = "on"


class Leftovers(support.Case):
    """What an earlier command left is no dead end for the next sync."""

    def setUp(self):
        super().setUp()
        self.init("--coordination", "on")
        self.package = self.offer("com.a", body=support.noise(100_000))
        self.sync()
        self.data = self.phone / "root/var/mobile/Containers/Data/com.a/notes"
        self.data.write_text("notes")

    def restore_on_new_phone(self):
        self.run_appsync("backup", self.folder / "backup")
        self.phone = self.folder / "new"
        self.environment["APPSYNC_DEVICE"] = str(self.phone)
        self.init("--coordination", "on")
        self.run_appsync("restore", self.folder / "backup")
        self.assertEqual(self.apps(), {"com.a?": "1.0"})

    def test_after_a_clear_a_sync_installs_what_was_to_be_restored(self):
        self.restore_on_new_phone()
        self.run_appsync("clear")
        self.assertEqual(self.apps(), {})
        self.assertEqual(self.sync()["installed"], ["com.a"])
        self.assertEqual(self.apps(), {"com.a": "1.0"})

    def test_after_a_cancel_a_sync_installs_what_was_to_be_restored_as_new(self):
        self.restore_on_new_phone()
        self.run_appsync("cancel", "com.a")
        self.assertEqual(self.apps(), {})
        self.assertEqual(self.sync()["installed"], ["com.a"])
        self.assertFalse((self.phone / "root/var/mobile/Containers/Data/com.a/notes").exists())

    def test_a_damaged_package_leaves_a_demoted_application_as_it_was(self):
        self.run_appsync("demote", "com.a")
        damaged = bytearray(self.package.read_bytes())
        damaged[len(damaged) // 2] ^= 0xFF
        self.package.write_bytes(damaged)
        summary = self.sync("--install", "com.a", code=1)
        self.assertEqual([entry["identifier"] for entry in summary["failed"]], ["com.a"])
        self.assertEqual(self.apps(), {"com.a?": "1.0"})
        self.assertEqual(self.data.read_text(), "notes")
        self.offer("com.a", body=support.noise(100_000))
        self.assertEqual(self.sync("--install", "com.a")["installed"], ["com.a"])
        self.assertEqual(self.data.read_text(), "notes")


class Refusals(support.Case):
    def check_refused(self, identifier):
        for command in ("tap", "cancel"):
            [error] = self.json_lines(command, identifier, code=1)
            self.assertEqual(error["event"], "error")
            self.assertIn(f"cannot {command} {identifier}: {identifier} is not being installed",
                          error["message"])

    def test_what_is_not_being_installed(self):
        self.init("--coordination", "on")
        self.offer("com.a")
        self.sync()
        for identifier in ("com.a", "com.absent", "../../etc"):
            self.check_refused(identifier)

    def test_a_phone_that_does_not_coordinate(self):
        self.init()
        self.check_refused("com.a")

    def test_usage_and_phone(self):
        for command in ("tap", "cancel"):
            self.run_appsync(command, code=2)
            self.run_appsync(command, "com.a", code=3)


if __name__ == "__main__":
    support.main()
