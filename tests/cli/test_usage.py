"""Wrong usage and unusable devices and plug-ins: the exit code, and one line that helps."""

import json
import os
import plistlib
import shutil
import sqlite3
import subprocess

import support


class Usage(support.Case):
    def one_line(self, *arguments, code):
        out, err = self.run_appsync(*arguments, code=code)
        self.assertEqual(out, "")
        self.assertTrue(err.startswith("appsync: "), err)
        self.assertEqual(err.count("\n"), 1, err)
        return err[len("appsync: "):-1]

    def test_help_and_version(self):
        out, _ = self.run_appsync("--help")
        for word in ("sync", "init", "package", "Examples:", "Exit codes:"):
            self.assertIn(word, out)
        out, _ = self.run_appsync("sync", "--help")
        self.assertIn("--icon-layout", out)
        out, _ = self.run_appsync("--version")
        self.assertRegex(out, r"^appsync \d+\.\d+\.\d+\n$")

    def commands(self):
        out, _ = self.run_appsync("--help")
        listed = out[out.index("Subcommands:"):out.index("Examples:")].splitlines()[1:]
        return [line.split()[0] for line in listed if line.strip()]

    def test_each_command_helps_with_an_example_of_its_own(self):
        commands = self.commands()
        self.assertEqual(sorted(commands), [
            "apps", "backup", "cancel", "clear", "demote", "help", "history", "home-screen", "init",
            "launch", "log", "package", "policy", "quit", "restore", "status", "sync", "tap",
            "uninstall"])
        for command in commands:
            out, _ = self.run_appsync(command, "--help")
            examples = [line for line in out.splitlines() if line.startswith("Example")]
            self.assertEqual(len(examples), 1, out)
            self.assertRegex(examples[0], rf"^Example: appsync (--\S+ (\S*phone )?)*{command}\b")
            self.assertNotIn("Exit codes", out)

    def test_help_is_a_command_too(self):
        self.assertEqual(self.run_appsync("help"), self.run_appsync("--help"))
        for command in self.commands():
            self.assertEqual(self.run_appsync("help", command),
                             self.run_appsync(command, "--help"))
        self.assertEqual(self.one_line("help", "dance", code=2),
                         'unknown command "dance"; see appsync --help')

    def test_numbers_begin_at_one(self):
        for command, option in (("history", "--limit"), ("log", "--limit"),
                                ("home-screen", "--page")):
            output = ("-o", "x.png") if command == "home-screen" else ()
            for number in ("0", "-1", "1.5", "+1", "many", "00", "9" * 40):
                self.assertEqual(
                    self.one_line(command, *output, f"{option}={number}", code=2),
                    f"{option}: must be a whole number from 1 to 999999999; "
                    f"see appsync {command} --help")

    def test_bad_arguments(self):
        self.assertIn('unknown command "dance"', self.one_line("dance", code=2))
        self.assertIn("see appsync --help", self.one_line(code=2))
        self.assertIn("see appsync sync --help", self.one_line("sync", code=2))
        self.one_line("--frobnicate", "apps", code=2)
        self.one_line("apps", "extra", code=2)
        self.one_line("sync", self.library, "--install", code=2)
        self.one_line("policy", "--installing", "maybe", code=2)
        self.one_line("init", "--coordination", "sometimes", code=2)
        self.one_line("history", "--limit", "many", code=2)
        self.one_line("log", "--level", "loud", code=2)

    def test_an_empty_identifier(self):
        for arguments in (("sync", self.library, "--install", ""), ("sync", self.library, "--remove", ""),
                          ("restore", self.folder, "--only", ""), ("uninstall", ""), ("demote", ""),
                          ("launch", ""), ("quit", ""), ("tap", ""), ("cancel", "")):
            self.assertIn("an identifier is not empty", self.one_line(*arguments, code=2))

    def test_errors_are_objects_with_json(self):
        self.assertIn("unknown command", self.json_lines("dance", code=2)[0]["message"])
        self.assertEqual(self.json_lines("apps", code=3)[0]["event"], "error")

    def test_no_device_named(self):
        del self.environment["APPSYNC_DEVICE"]
        self.assertIn("--device", self.one_line("apps", code=2))

    def test_options_may_stand_behind_the_command(self):
        del self.environment["APPSYNC_DEVICE"]
        self.run_appsync("init", "--device", self.phone)
        out, _ = self.run_appsync("policy", "--json", "-d", self.phone)
        self.assertEqual(json.loads(out)["installing"], "allow")

    def test_missing_device(self):
        self.assertIn(str(self.phone), self.one_line("apps", code=3))
        self.assertIn(str(self.phone), self.one_line("sync", self.library, code=3))
        self.assertIn(str(self.phone), self.one_line("launch", "com.a", code=3))
        self.assertFalse(self.phone.exists())

    def test_foreign_folder(self):
        self.phone.mkdir()
        (self.phone / "thesis.txt").write_text("years of work")
        self.one_line("apps", code=3)
        self.one_line("sync", self.library, code=3)
        self.one_line("init", code=3)
        self.assertEqual([path.name for path in self.phone.iterdir()], ["thesis.txt"])

    def test_foreign_database(self):
        self.init()
        (self.phone / "device.db").unlink()
        database = sqlite3.connect(self.phone / "device.db")
        database.execute("CREATE TABLE recipes (name)")
        database.commit()
        database.close()
        self.one_line("sync", self.library, code=3)

    def test_damaged_device(self):
        self.init()
        for name in ("device.db-wal", "device.db-shm"):
            (self.phone / name).unlink(missing_ok=True)
        (self.phone / "device.db").write_bytes(b"garbage" * 1000)
        self.one_line("apps", code=3)
        self.one_line("sync", self.library, code=3)

    def test_a_device_is_not_made_twice(self):
        self.init()
        self.one_line("init", code=3)

    def test_library_that_cannot_be_read(self):
        self.init()
        self.assertIn("nowhere", self.one_line("sync", self.folder / "nowhere", code=2))
        self.assertIn("no package for com.a in", self.one_line("sync", self.library, "--install",
                                                               "com.a", code=2))
        self.assertIn("--mirror", self.one_line("sync", self.library, "--mirror", code=2))

    def test_bad_icon_layout(self):
        self.init()
        layout = self.folder / "layout"
        self.one_line("sync", self.library, "--icon-layout", layout, code=2)
        layout.write_text("<what> is {this}")
        self.one_line("sync", self.library, "--icon-layout", layout, code=2)

    def test_applications_that_are_not_there(self):
        self.init()
        for command in ("uninstall", "launch", "demote"):
            self.assertIn("com.absent", self.one_line(command, "com.absent", code=1))
        self.run_appsync("quit", "com.absent")

    def test_what_the_policy_forbids_to_remove_stays(self):
        self.init()
        self.offer("com.a")
        self.sync()
        self.run_appsync("policy", "--removing", "forbid")
        for command in ("uninstall", "demote"):
            self.assertEqual(self.one_line(command, "com.a", code=1), f"cannot {command} com.a: "
                             "removing applications is forbidden on this phone")
        self.assertEqual(self.apps(), {"com.a": "1.0"})
        self.run_appsync("policy", "--removing", "allow")
        self.run_appsync("uninstall", "com.a")
        self.assertEqual(self.apps(), {})

    def test_output_that_cannot_be_written(self):
        self.init()
        for arguments in (["policy"], ["--help"], ["help"], ["sync", "--help"], ["--version"]):
            with open("/dev/full", "w") as full:
                process = subprocess.run([support.APPSYNC, *arguments], stdout=full,
                                         stderr=subprocess.PIPE, text=True, env=self.environment)
            self.assertEqual(process.returncode, 1, arguments)
            self.assertIn("cannot write to standard output", process.stderr)


class ClosedDescriptors(support.Case):
    """The command, started without some of the three descriptors that everybody has."""

    def run_without(self, closed, *arguments):
        def close():
            for descriptor in closed:
                os.close(descriptor)
        done = subprocess.run([support.APPSYNC, *map(str, arguments)], stdin=subprocess.DEVNULL,
                              capture_output=True, text=True, env=self.environment,
                              preexec_fn=close, timeout=60)
        return done.returncode, done.stdout, done.stderr

    def test_no_line_is_written_into_the_phone(self):
        self.init()
        self.offer("com.a")
        closed = [[0], [1], [2], [0, 1], [1, 2], [0, 1, 2]]
        for number, descriptors in enumerate(closed):
            version = f"{number + 1}.0"
            self.offer("com.a", version)
            (self.library / "broken.zip").write_bytes(b"garbage")
            code, out, err = self.run_without(descriptors, "sync", self.library)
            self.assertEqual((code, err), (1, ""), descriptors)
            self.assertEqual("broken.zip" in out, 1 not in descriptors)
            self.assertRegex((self.phone / "lock").read_text(), r"^\d+\n$", descriptors)
            self.assertEqual(self.apps(), {"com.a": version})

    def test_every_command_works_without_them(self):
        self.assertEqual(self.run_without([0, 1, 2], "init"), (0, "", ""))
        for command in (["apps"], ["status"], ["log"], ["policy", "--removing", "forbid"],
                        ["policy", "--removing", "allow"], ["backup", self.folder / "backup"],
                        ["clear"], ["home-screen", "-o", self.folder / "screen.png"]):
            self.assertEqual(self.run_without([0, 1, 2], *command), (0, "", ""), command)
        self.assertEqual(self.json_lines("policy")[0]["removing"], "allow")
        self.assertEqual(sorted(path.name for path in (self.folder / "backup").iterdir()),
                         ["Data", "DemotedApps.plist", "IconState.plist", "Manifest.plist",
                          "RestoreApplications.plist"])


class Plugins(support.Case):
    def setUp(self):
        super().setUp()
        self.init()
        self.plugin = self.folder / "Copy.syncplugin"
        shutil.copytree(os.path.join(os.path.dirname(support.APPSYNC), "AppsClient.syncplugin"),
                        self.plugin)
        self.environment["APPSYNC_PLUGIN"] = str(self.plugin)

    def refusal(self):
        message = self.json_lines("sync", self.library, code=2)[0]["message"]
        self.assertIn(str(self.plugin), message)
        return message

    def test_a_copy_works(self):
        self.sync()

    def test_missing(self):
        shutil.rmtree(self.plugin)
        self.assertIn("--plugin", self.refusal())

    def test_other_version_in_the_description(self):
        path = self.plugin / "Info.plist"
        description = plistlib.loads(path.read_bytes())
        description["PluginInterfaceVersion"] = 7
        path.write_bytes(plistlib.dumps(description))
        self.assertIn("interface version 7", self.refusal())

    def test_other_version_in_the_code(self):
        shutil.copy(os.environ["OTHER_VERSION_PLUGIN"], self.plugin / "AppsClient.so")
        self.assertIn("interface version 2", self.refusal())

    def test_code_that_cannot_be_loaded(self):
        (self.plugin / "AppsClient.so").write_bytes(b"\x7fELF but not really")
        self.assertIn("cannot be loaded", self.refusal())


if __name__ == "__main__":
    support.main()
