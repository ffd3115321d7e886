"""What the tests of backups and restores share: an old phone, its backup, and new phones."""

import filecmp
import hashlib
import pathlib
import plistlib

import support

APPLICATIONS = ("com.a", "com.b", "com.c", "com.d")
DATA = "root/var/mobile/Containers/Data"
WAITING = "root/var/mobile/Media/HalvoRestore/Data"


def change_backup(folder, name, contents):
    """Puts other contents into a file of a backup, and what its manifest tells of it."""
    (folder / name).write_bytes(contents)
    manifest = plistlib.loads((folder / "Manifest.plist").read_bytes())
    manifest["Files"][name] = {"Size": len(contents), "SHA256": hashlib.sha256(contents).hexdigest()}
    (folder / "Manifest.plist").write_bytes(plistlib.dumps(manifest))


class RestoreCase(support.Case):
    """The old phone has four applications. In its backup, two of them are demoted."""
    coordination = "off"

    def setUp(self):
        super().setUp()
        self.init("--coordination", self.coordination)
        for identifier in APPLICATIONS:
            self.offer(identifier)
        layout = self.folder / "layout"
        layout.write_text("com.d\ncom.b\ncom.c\ncom.a\n")
        self.sync("--icon-layout", layout)
        for identifier in ("com.a", "com.c", "com.d"):
            self.put_data(identifier)
        self.backup = self.folder / "backup"
        self.take_backup(self.backup)
        change_backup(self.backup, "DemotedApps.plist", plistlib.dumps(
            {"AutomaticDowngrades": ["com.c"], "IntentionalDowngrades": ["com.d"]}))

    def put_data(self, identifier):
        data = self.phone / DATA / identifier
        (data / "Documents").mkdir(parents=True)
        (data / "Documents/notes").write_text(f"notes of {identifier}")
        (data / "latest").symlink_to("Documents/notes")

    def take_backup(self, folder):
        self.json_lines("backup", folder)

    def use(self, name):
        """From now on commands reach the phone of this name; a new one if there is none."""
        self.phone = self.folder / name
        self.environment["APPSYNC_DEVICE"] = str(self.phone)
        if not self.phone.exists():
            self.init("--coordination", self.coordination)

    def restore(self, *arguments, code=0):
        """A whole restore of the backup; its summary."""
        events = self.json_lines("restore", self.backup, *arguments, code=code)
        self.check_events(events)
        self.events = events
        return events[-1]

    def start_restore(self, *arguments):
        return self.start("--json", "restore", self.backup, *arguments)

    def reasons(self, entries):
        return {entry["identifier"]: entry["reason"] for entry in entries}

    def notes(self, identifier, folder=DATA):
        file = self.phone / folder / identifier / "Documents/notes"
        return file.read_text() if file.exists() else None

    def check_same(self, first, second):
        """Both folders hold the same, byte for byte."""
        names = [sorted(str(path.relative_to(folder)) for path in pathlib.Path(folder).rglob("*"))
                 for folder in (first, second)]
        self.assertEqual(*names)
        files = [name for name in names[0] if (first / name).is_file()]
        _, different, failed = filecmp.cmpfiles(first, second, files, shallow=False)
        self.assertEqual((different, failed), ([], []))
