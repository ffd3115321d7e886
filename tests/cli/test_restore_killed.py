"""Restores that are killed after each line they tell, or after a sample of the lines in slow builds:
a second one ends as an undisturbed one."""

import os

import support
from restore_support import RestoreCase


class Killed(RestoreCase):
    packages = "--store"  # whoever brings them

    def picture(self):
        """What a person finds on the phone."""
        self.take_backup(self.folder / "look")
        files = {str(path.relative_to(self.folder / "look")): path.read_bytes()
                 for path in (self.folder / "look").rglob("*") if path.is_file()}
        apps = [{key: app[key] for key in ("identifier", "version", "name", "placeholder")}
                for app in self.json_lines("apps")]
        return apps, files

    def test_killed_after_any_line(self):
        arguments = (self.packages, self.library)
        self.use("undisturbed")
        self.restore(*arguments)
        expected = self.picture()
        for number in range(0, len(self.events), int(os.environ["SWEEP_STEP"])):
            self.use(f"killed-{number}")
            process = self.start_restore(*arguments)
            for _ in range(number + 1):
                process.stdout.readline()
            process.kill()
            process.communicate()
            self.restore(*arguments)
            self.assertEqual(self.picture(), expected, f"killed after {number + 1} events")


class CoordinatedKilled(Killed):
    coordination = "on"


class PackagesKilled(Killed):
    packages = "--packages"


if __name__ == "__main__":
    support.main()
