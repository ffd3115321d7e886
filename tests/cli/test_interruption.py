"""Syncs that wait, that are interrupted, and that are killed."""

import json
import os
import pty
import select
import signal
import time

import support


class Interruption(support.Case):
    def setUp(self):
        super().setUp()
        self.init()

    def start_sync(self, *arguments):
        return self.start("--json", "sync", self.library, *arguments)

    def await_event(self, process, condition):
        """Reads events until one meets the condition."""
        for line in process.stdout:
            event = json.loads(line)
            if condition(event):
                return event
        self.fail("the sync ended without the event: " + process.stderr.read())

    def staged(self):
        """What lies where packages arrive."""
        staging = self.phone / "root/var/mobile/Media/PublicStaging"
        return [path.name for path in staging.iterdir()]

    def rest_of_events(self, process):
        out, err = self.rest(process)
        return [json.loads(line) for line in out.splitlines()], err

    def open_app_with_update(self):
        """An application that is open on the phone, and an update of it in the library."""
        self.offer("com.open")
        self.sync()
        self.run_appsync("launch", "com.open")
        self.offer("com.open", "2.0")

    def waiting_sync(self):
        self.open_app_with_update()
        process = self.start_sync()
        event = self.await_event(process, lambda event: event["event"] == "waiting")
        self.assertEqual(event["identifier"], "com.open")
        self.assertEqual(event["retrySeconds"], 30)
        self.assertIn("appsync quit com.open", event["message"])
        return process

    def check_interrupted_while_waiting(self, process, signal_number):
        begin = time.monotonic()
        process.send_signal(signal_number)
        events, _ = self.rest_of_events(process)
        self.assertEqual(process.returncode, 130)
        self.assertLess(time.monotonic() - begin, 10)
        self.assertEqual(events[-1]["event"], "summary")
        self.assertEqual([entry["identifier"] for entry in events[-1]["failed"]], ["com.open"])

    def test_interrupt_while_an_install_waits(self):
        process = self.waiting_sync()
        self.assertEqual(self.json_lines("sync", self.library, code=3)[0]["event"], "error")
        self.check_interrupted_while_waiting(process, signal.SIGINT)
        self.assertEqual(self.apps()["com.open"], "1.0")

        # Quitting needs no lock, and the next sync does what was left.
        self.run_appsync("quit", "com.open")
        self.assertEqual(self.sync()["updated"], ["com.open"])
        self.assertEqual(self.apps(), {"com.open": "2.0"})

    def test_terminate_while_an_install_waits(self):
        self.check_interrupted_while_waiting(self.waiting_sync(), signal.SIGTERM)

    def test_a_terminal_that_goes_away_while_an_install_waits(self):
        process = self.waiting_sync()
        process.send_signal(signal.SIGHUP)
        self.check_interrupted_while_waiting(process, signal.SIGHUP)

    def test_looking_is_possible_while_a_sync_runs(self):
        process = self.waiting_sync()
        self.assertEqual(self.apps(), {"com.open": "1.0", "com.open?": "2.0"})
        self.assertEqual(self.json_lines("status")[0]["foreground"], ["com.open"])
        self.run_appsync("quit", "com.open")
        self.assertEqual(self.json_lines("status")[0]["foreground"], [])
        self.check_interrupted_while_waiting(process, signal.SIGINT)

    def test_an_open_application_harms_no_other(self):
        self.open_app_with_update()
        self.offer("com.other")
        process = self.start_sync()
        self.await_event(process, lambda event: event["event"] == "install-ended"
                         and event["identifier"] == "com.other")
        process.send_signal(signal.SIGINT)
        events, _ = self.rest_of_events(process)
        self.assertEqual(events[-1]["installed"], ["com.other"])

    def test_interrupt_while_sending(self):
        self.offer("com.big", body=support.noise(80_000_000), ending=".tar")
        self.offer("com.small")
        process = self.start_sync()
        self.await_event(process, lambda event: event["event"] == "transfer")
        process.send_signal(signal.SIGINT)
        events, _ = self.rest_of_events(process)
        self.assertEqual(process.returncode, 130)
        self.assertIn("interrupted", [event["event"] for event in events])
        self.assertEqual({entry["identifier"] for entry in events[-1]["failed"]},
                         {"com.big", "com.small"})
        self.assertEqual(self.staged(), [])
        self.assertEqual(self.sync()["installed"], ["com.big", "com.small"])

    def test_a_second_interrupt_ends_at_once(self):
        process = self.waiting_sync()
        process.send_signal(signal.SIGINT)
        process.send_signal(signal.SIGINT)
        process.communicate(timeout=20)
        self.assertEqual(process.returncode, 130)
        self.run_appsync("quit", "com.open")
        self.assertEqual(self.sync()["updated"], ["com.open"])

    def test_killed_while_sending(self):
        self.offer("com.big", body=support.noise(60_000_000), ending=".tar")
        self.offer("com.small")
        for share in (0.02, 0.5, 0.95):
            process = self.start_sync()
            self.await_event(process, lambda event: event["event"] == "transfer"
                             and event["sent"] >= share * event["total"])
            process.kill()
            process.communicate()
            self.assertNotIn("com.big", self.apps())
        self.assertEqual(self.sync()["installed"], ["com.big", "com.small"])
        self.assertEqual(self.apps(), {"com.big": "1.0", "com.small": "1.0"})
        self.assertEqual(self.staged(), [])

    def test_killed_at_any_time(self):
        for number in range(6):
            self.offer(f"com.app{number}", body=support.noise(2_000_000 + number))
        for lines in (0, 1, 4, 8, 16, 40, 100):
            process = self.start_sync()
            for _ in range(lines):  # after the end they are empty
                process.stdout.readline()
            process.kill()
            process.communicate()
            for app in self.json_lines("apps"):
                if not app["placeholder"]:
                    bundle = self.phone / "root" / app["path"].lstrip("/")
                    self.assertGreater((bundle / "body").stat().st_size, 2_000_000 - 1)
        self.sync()
        self.assertEqual(self.apps(), {f"com.app{number}": "1.0" for number in range(6)})

    def test_a_reader_that_goes_away_does_not_stop_the_sync(self):
        for number in range(5):
            self.offer(f"com.app{number}")
        process = self.start("--json", "sync", self.library)
        process.stdout.close()
        error = process.stderr.read()
        self.assertEqual(process.wait(60), 0)
        self.assertIn("nobody reads the output", error)
        self.assertEqual(len(self.apps()), 5)


class Terminal(support.Case):
    def setUp(self):
        super().setUp()
        self.init()
        self.environment["TERM"] = "xterm"

    def on_terminal(self, *arguments, interrupt_at=None):
        """What the command shows on a terminal, and its exit code."""
        pid, terminal = pty.fork()
        if pid == 0:
            os.execve(support.APPSYNC, [support.APPSYNC, *map(str, arguments)], self.environment)
        shown = b""
        while select.select([terminal], [], [], 60)[0]:
            try:
                piece = os.read(terminal, 65536)
            except OSError:
                break
            shown += piece
            if interrupt_at and interrupt_at in shown:
                os.write(terminal, b"\x03")
                interrupt_at = None
        os.close(terminal)
        return shown.decode(), os.waitstatus_to_exitcode(os.waitpid(pid, 0)[1])

    def test_bars_and_colours(self):
        self.offer("com.a", body=support.noise(3_000_000))
        shown, code = self.on_terminal("sync", self.library)
        self.assertEqual(code, 0)
        self.assertIn("Sending A", shown)
        self.assertIn("100%", shown)
        self.assertIn("\x1b[32minstalled", shown)
        self.assertGreater(shown.rfind("\x1b[?25h"), shown.rfind("\x1b[?25l"))
        self.assertTrue(shown.endswith("1 installed\r\n"))

    def test_no_color(self):
        self.offer("com.a")
        self.environment["NO_COLOR"] = "1"
        shown, _ = self.on_terminal("sync", self.library)
        self.assertNotRegex(shown, r"\x1b\[\d*m")
        self.assertIn("installed  A 1.0 (com.a)", shown)

    def test_a_dumb_terminal_gets_plain_lines(self):
        self.offer("com.a")
        self.environment["TERM"] = "dumb"
        shown, _ = self.on_terminal("sync", self.library)
        self.assertNotIn("\x1b", shown)

    def test_control_c_shows_the_cursor_again(self):
        self.offer("com.big", body=support.noise(80_000_000), ending=".tar")
        shown, code = self.on_terminal("sync", self.library, interrupt_at=b"Sending Big")
        self.assertEqual(code, 130)
        self.assertIn("ending     \x1b[0m cleanly", shown.replace("ending    ", "ending     "))
        self.assertGreater(shown.rfind("\x1b[?25h"), shown.rfind("\x1b[?25l"))

    def test_nothing_but_plain_lines_elsewhere(self):
        self.offer("com.a", body=support.noise(3_000_000))
        out, err = self.run_appsync("sync", self.library)
        self.assertEqual(out, "installed  A 1.0 (com.a)\ndone       1 installed\n")
        self.assertEqual(err, "")
        out, err = self.run_appsync("--quiet", "sync", self.library)
        self.assertEqual((out, err), ("", ""))

    def test_quiet_tells_failures(self):
        (self.library / "broken.zip").write_bytes(b"garbage")
        out, err = self.run_appsync("--quiet", "sync", self.library, code=1)
        self.assertEqual(out, "")
        self.assertEqual(err, "appsync: failed broken.zip: it is neither a zip nor a tar archive\n")


if __name__ == "__main__":
    support.main()
