"""The picture of the home screen."""

import fcntl
import json
import shutil
import signal
import struct
import zlib

import support

RED = (230, 20, 30)


def png(colour, side=64):
    """A picture of one colour, as a file."""
    def chunk(kind, data):
        return (struct.pack(">I", len(data)) + kind + data
                + struct.pack(">I", zlib.crc32(kind + data)))

    rows = (b"\0" + bytes(colour) * side) * side
    return (b"\x89PNG\r\n\x1a\n" + chunk(b"IHDR", struct.pack(">IIBBBBB", side, side, 8, 2, 0, 0, 0))
            + chunk(b"IDAT", zlib.compress(rows)) + chunk(b"IEND", b""))


def size_of(path):
    data = path.read_bytes()
    assert data.startswith(b"\x89PNG\r\n\x1a\n"), data[:8]
    return struct.unpack(">II", data[16:24])


def predicted(kind, left, above, corner):
    """What a PNG filter expects of a byte."""
    if kind < 4:
        return (0, left, above, (left + above) // 2)[kind]
    base = left + above - corner
    return min((left, above, corner), key=lambda value: abs(base - value))


def top_rows(path, count):
    """The upper rows of a picture, each a list of (red, green, blue, alpha)."""
    data = path.read_bytes()
    width, _ = size_of(path)
    compressed, at = b"", 8
    while at < len(data):
        length, kind = struct.unpack(">I4s", data[at:at + 8])
        if kind == b"IDAT":
            compressed += data[at + 8:at + 8 + length]
        at += 12 + length
    stride = width * 4
    raw = zlib.decompressobj().decompress(compressed, (stride + 1) * count)
    rows, above = [], bytearray(stride)
    for number in range(count):
        begin = number * (stride + 1)
        kind, row = raw[begin], bytearray(raw[begin + 1:begin + 1 + stride])
        if kind:
            for i in range(stride):
                left, corner = (row[i - 4], above[i - 4]) if i >= 4 else (0, 0)
                row[i] = row[i] + predicted(kind, left, above[i], corner) & 255
        rows.append([tuple(row[i:i + 4]) for i in range(0, stride, 4)])
        above = row
    return rows


class HomeScreen(support.Case):
    def setUp(self):
        super().setUp()
        self.init()
        self.picture = self.folder / "screen.png"

    def offer_with_icon(self, identifier, icon, body=b"", **more):
        bundle = self.bundle(identifier, body=body, KBBundleIconFile="Icon.png", **more)
        (bundle / "Icon.png").write_bytes(icon)
        self.run_appsync("package", bundle, "-o", self.library / f"{identifier}.tar")

    def draw(self, *arguments):
        """Draws the picture and gives what is told of it, but for the file's name."""
        event, = self.json_lines("home-screen", "-o", self.picture, *arguments)
        self.assertEqual(event.pop("event"), "home-screen")
        self.assertEqual(event.pop("file"), str(self.picture))
        return event

    def refused(self, *arguments, code):
        event, = self.json_lines("home-screen", *arguments, code=code)
        self.assertEqual(event["event"], "error")
        return event["message"]

    def test_a_new_device_has_an_empty_screen(self):
        self.assertEqual(self.draw(), {"pages": 1, "icons": 0})
        width, height = size_of(self.picture)
        self.assertGreater(height, width)
        out, err = self.run_appsync("home-screen", "-o", self.picture)
        self.assertEqual((out, err), (f"{self.picture}: 1 page, 0 icons\n", ""))
        self.assertEqual(self.run_appsync("--quiet", "home-screen", "-o", self.picture), ("", ""))

    def test_a_killed_sync_shows_how_far_it_had_come(self):
        self.offer_with_icon("com.a", png(RED))
        self.sync()
        self.offer_with_icon("com.big", png(RED), support.noise(80_000_000))
        pictures = []
        for share in (0.1, 0.55):
            process = self.start("--json", "sync", self.library)
            # A short pipe keeps the sync from running far ahead of what is read here.
            fcntl.fcntl(process.stdout, fcntl.F_SETPIPE_SZ, 4096)
            for line in process.stdout:
                event = json.loads(line)
                if event["event"] == "transfer" and event["sent"] >= share * event["total"]:
                    break
            process.kill()
            process.communicate()
            self.assertEqual(self.apps(), {"com.a": "1.0", "com.big?": "1.0"})
            self.assertEqual(self.draw(), {"pages": 1, "icons": 2})
            pictures.append(top_rows(self.picture, 250))
        self.sync()
        self.assertEqual(self.draw(), {"pages": 1, "icons": 2})
        after = top_rows(self.picture, 250)

        red = [(x, y) for y, row in enumerate(after) for x, pixel in enumerate(row)
               if pixel[:3] == RED]
        middle = (min(red)[0] + max(red)[0]) / 2
        first = [spot for spot in red if spot[0] < middle]
        second = [spot for spot in red if spot[0] > middle]
        self.assertEqual(len(first), len(second))
        white = []
        for picture in pictures:
            self.assertTrue(all(picture[y][x][:3] == RED for x, y in first))
            self.assertFalse(any(picture[y][x][:3] == RED for x, y in second))
            darker = sum(sum(picture[y][x][:3]) < sum(RED) for x, y in second)
            self.assertGreater(darker, len(second) / 2)
            white.append(sum(min(picture[y][x]) > 220 for x, y in second))
        self.assertGreater(white[0], 0)
        self.assertGreater(white[1], white[0])

    def test_it_can_be_drawn_while_a_sync_runs(self):
        self.offer("com.open")
        self.sync()
        self.run_appsync("launch", "com.open")
        self.offer("com.open", "2.0")
        process = self.start("--json", "sync", self.library)
        for line in process.stdout:
            if json.loads(line)["event"] == "waiting":
                break
        self.assertEqual(self.draw(), {"pages": 1, "icons": 1})
        process.send_signal(signal.SIGINT)
        self.rest(process)
        self.assertEqual(process.returncode, 130)

    def test_pages(self):
        for number in range(25):
            self.offer_raw(f"{number}.zip", {
                f"A{number}.app/Info.plist": support.plistlib.dumps(
                    support.info(f"com.app{number}")),
                f"A{number}.app/run": "#!/bin/sh\n"})
        self.sync()
        self.assertEqual(self.draw(), {"pages": 2, "icons": 25})
        both = size_of(self.picture)
        self.assertEqual(self.draw("--page", "2"), {"pages": 1, "icons": 1})
        one = size_of(self.picture)
        self.assertGreater(both[0], 2 * one[0])
        self.assertEqual(both[1], one[1])
        message = self.refused("-o", self.picture, "--page", "3", code=2)
        self.assertEqual(message, "there is no page 3: the home screen has 2 pages")

    def test_icons_and_names_from_anywhere_do_no_harm(self):
        icons = [b"", b"no picture", png(RED)[:70], png(RED)[:20] + b"\xff" * 60, b"\xff\xd8\xff"]
        names = ["", "\u202eexe", "a\nb\tc", "\U0001f3b2", "z" + "\u0302" * 500, "x" * 100_000]
        for number, icon in enumerate(icons):
            self.offer_with_icon(f"com.icon{number}", icon)
        for number, name in enumerate(names):
            self.offer_with_icon(f"com.name{number}", png(RED), KBBundleDisplayName=name)
        self.sync()
        self.assertEqual(self.draw(), {"pages": 1, "icons": len(icons) + len(names)})

    def test_the_same_screen_gives_the_same_bytes_anywhere(self):
        self.offer("com.a")
        self.sync()
        pictures = set()
        for environment in ({}, {"LC_ALL": "C", "HOME": "/nonexistent"},
                            {"FONTCONFIG_FILE": "/nonexistent", "LANG": "ja_JP.UTF-8",
                             "XDG_CACHE_HOME": "/nonexistent", "DISPLAY": ":9"}):
            self.environment.update(environment)
            self.draw()
            pictures.add(self.picture.read_bytes())
        self.assertEqual(len(pictures), 1)

    def test_a_picture_is_replaced_whole_and_nothing_else_is_left(self):
        self.picture.write_text("old")
        self.draw()
        self.assertGreater(size_of(self.picture)[0], 0)
        self.assertEqual({path.name for path in self.folder.iterdir()},
                         {"phone", "library", "screen.png"})

    def test_errors(self):
        def message(*arguments, code=1):
            return self.refused(*arguments, code=code)

        missing = self.folder / "missing" / "screen.png"
        self.assertEqual(message("-o", missing), f"cannot write {missing}: No such file or directory")
        folder = self.folder / "folder.png"
        folder.mkdir()
        self.assertEqual(message("-o", folder), f"cannot write {folder}: it is no regular file")
        device = self.folder / "null.png"
        device.symlink_to("/dev/null")
        self.assertEqual(message("-o", device), f"cannot write {device}: it is no regular file")
        self.assertTrue(device.is_symlink())
        self.assertIn("must end in .png", message("-o", self.folder / "a.jpg", code=2))
        self.assertIn("--output is required", message(code=2))
        self.assertIn("--page", message("-o", self.picture, "--page", "0", code=2))
        self.environment["APPSYNC_DEVICE"] = str(self.folder / "nowhere")
        self.assertIn("there is no phone", message("-o", self.picture, code=3))
        self.assertFalse(self.picture.exists())

    def test_without_its_drawing_part_it_says_so(self):
        command = shutil.copy(support.APPSYNC, self.folder)
        _, err = self.run_appsync("home-screen", "-o", self.picture, executable=command, code=1)
        self.assertIn("there is no HomeScreen.so beside appsync", err)
        self.assertFalse(self.picture.exists())


if __name__ == "__main__":
    support.main()
