"""What the phone tells of its applications' past."""

import support


class History(support.Case):
    def setUp(self):
        super().setUp()
        self.init(*self.options())

    def options(self):
        return ()

    def history(self, *arguments):
        """A line an entry: event, identifier, versions, by whom, and the reason."""
        lines = []
        for entry in self.json_lines("history", *arguments):
            self.assertEqual(list(entry), ["number", "time", "event", "identifier", "version",
                                           "replaced", "by", "reason"])
            versions = [version for version in (entry["replaced"], entry["version"]) if version]
            words = [entry["event"], entry["identifier"], *versions, "by", entry["by"]]
            lines.append(" ".join(words) + (": " + entry["reason"] if entry["reason"] else ""))
        return lines

    def test_the_life_of_an_application(self):
        self.offer("com.a")
        self.sync()
        self.sync("--install", "com.a")
        self.offer("com.a", "1.1")
        self.sync()
        self.offer("com.a", "0.9")
        self.sync("--install", "com.a")
        self.run_appsync("demote", "com.a")
        self.run_appsync("uninstall", "com.a")
        self.sync()
        self.sync("--remove", "com.a")
        entries = ["installed com.a 1.0 by sync", "reinstalled com.a 1.0 1.0 by sync",
                   "updated com.a 1.0 1.1 by sync", "downgraded com.a 1.1 0.9 by sync",
                   "demoted com.a 0.9 by person", "removed com.a 0.9 by person",
                   "installed com.a 0.9 by sync", "removed com.a 0.9 by sync"]
        self.assertEqual(self.history(), entries)
        self.assertEqual(self.history("--limit", "2"), entries[-2:])
        self.assertEqual(self.history("--limit", "100"), entries)

    def test_a_failed_install_reads_as_failed_and_why(self):
        self.offer("com.a")
        self.sync()
        package = self.offer("com.a", "2.0", body=support.noise(100_000))
        damaged = bytearray(package.read_bytes())
        damaged[50_000] ^= 1
        package.write_bytes(damaged)
        summary = self.sync(code=1)
        self.assertEqual(self.history(), [
            "installed com.a 1.0 by sync",
            "failed com.a 2.0 by sync: " + summary["failed"][0]["reason"]])

    def restore_on_another_phone(self):
        """Of com.a and com.b; gives the backup."""
        self.offer("com.a")
        self.offer("com.b")
        self.sync()
        backup = self.folder / "backup"
        self.run_appsync("backup", backup)
        self.environment["APPSYNC_DEVICE"] = str(self.folder / "other")
        self.init(*self.options())
        self.run_appsync("restore", backup)
        return backup

    def test_a_restore(self):
        backup = self.restore_on_another_phone()
        restored = ["restored com.a 1.0 by sync", "restored com.b 1.0 by sync"]
        self.assertEqual(sorted(self.history()), restored)
        self.run_appsync("restore", backup, "--store", self.library, "--quiet")
        self.run_appsync("uninstall", "com.b")
        self.assertEqual(sorted(self.history()[2:]), [
            "installed com.a 1.0 by store", "installed com.b 1.0 by store",
            "removed com.b 1.0 by person"])

    def test_a_restored_application_that_a_sync_brings_or_a_person_cancels(self):
        self.restore_on_another_phone()
        self.run_appsync("cancel", "com.b")
        self.sync("--install", "com.a")
        self.assertEqual(self.history()[2:], [
            "removed com.b 1.0 by person", "installed com.a 1.0 by sync"])

    def test_lines_for_people(self):
        self.assertEqual(self.run_appsync("history")[0], "No history yet.\n")
        self.offer("com.a")
        self.sync()
        self.offer("com.a", "1.1")
        self.sync()
        self.run_appsync("uninstall", "com.a")
        out, _ = self.run_appsync("history")
        self.assertEqual([line.split(maxsplit=1)[1] for line in out.splitlines()],
                         ["installed 1.0       com.a  by sync",
                          "updated 1.0 to 1.1  com.a  by sync",
                          "removed 1.1         com.a  by person"])


class CoordinatedHistory(History):
    def options(self):
        return ("--coordination", "on")


if __name__ == "__main__":
    support.main()
