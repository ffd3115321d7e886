"""Every sample application does what it says."""

import html.parser
import os
import pathlib
import plistlib
import re
import subprocess
import tempfile
import unittest
import wave
import xml.etree.ElementTree as ET

SOURCES = pathlib.Path(__file__).resolve().parents[2] / "examples" / "library-src"


def bundle(source):
    return next((SOURCES / source).glob("*.app"))


class Sample(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)

    def run_app(self, source, *words, stdin="", code=0):
        """What the application prints, on both outputs."""
        program = bundle(source) / bundle(source).stem
        done = subprocess.run(
            [program, *words], input=stdin, capture_output=True, text=True, timeout=60,
            cwd=self.folder, env={**os.environ, "APP_DATA": str(self.folder / "data")})
        self.assertEqual(done.returncode, code, done.stderr)
        return done.stdout + done.stderr

    def read_wave(self, name):
        with wave.open(str(self.folder / name)) as sound:
            return sound.getframerate(), memoryview(sound.readframes(sound.getnframes())).cast("h")


class Bundles(unittest.TestCase):
    def test_each_describes_itself_alike(self):
        identifiers = set()
        for source in sorted(SOURCES.iterdir()):
            app = bundle(source.name)
            info = plistlib.loads((app / "Info.plist").read_bytes())
            metadata = plistlib.loads((source / "HalvoMetadata.plist").read_bytes())
            with self.subTest(source.name):
                self.assertEqual(info["KBBundleExecutable"], app.stem)
                self.assertTrue(os.access(app / app.stem, os.X_OK))
                self.assertEqual(info["KBBundleIdentifier"], f"org.example.{app.stem.lower()}")
                self.assertEqual(info["KBBundleVersion"], metadata["bundleVersion"])
                self.assertEqual(info["KBBundleDisplayName"], metadata["title"])
                icon = SOURCES.parent / "icons" / app.stem
                ending = pathlib.Path(info["KBBundleIconFile"]).suffix
                self.assertTrue(icon.with_suffix(".svg" if ending == ".png" else ending).exists())
                identifiers.add(info["KBBundleIdentifier"])
        self.assertGreaterEqual(len(identifiers), 8)

    def test_icon_drawings_are_well_formed(self):
        for icon in (SOURCES.parent / "icons").glob("*.svg"):
            self.assertEqual(ET.parse(icon).getroot().get("viewBox"), "0 0 512 512", icon)


class Tally(Sample):
    def test_counts_and_takes_back(self):
        for version in ("Tally-1.0", "Tally-1.1"):
            self.run_app(version, "--date", "2024-03-01", "add", "water", "7")
            shown = self.run_app(version, "--date", "2024-03-01", "undo", "water")
            self.assertIn("water    6  ||||/ |", shown)
            self.run_app(version, "forget", "water")
            self.assertIn("nothing is counted", self.run_app(version, "undo", "water", code=1))

    def test_new_version_shows_the_week_and_reads_the_old_data(self):
        for day in ("01", "02", "03"):
            self.run_app("Tally-1.0", "--date", f"2024-03-{day}", "add", "run")
        self.assertIn("usage", self.run_app("Tally-1.0", "week", code=1))
        self.assertIn("3 days in a row", self.run_app("Tally-1.1", "--date", "2024-03-04"))
        week = self.run_app("Tally-1.1", "--date", "2024-03-04", "week")
        self.assertIn("Tu We Th Fr Sa Su Mo", week)
        self.assertIn("3 in all", week)


class Concord(Sample):
    def test_names_pitches(self):
        self.assertIn("A4", self.run_app("Concord", "441.5"))
        self.assertIn("6 cents sharp", self.run_app("Concord", "441.5"))
        self.assertIn("in tune", self.run_app("Concord", "442", "--a4", "442"))
        self.assertIn("no note", self.run_app("Concord", "banjo", code=1))

    def test_sounds_the_strings_of_an_instrument(self):
        shown = self.run_app("Concord", "violin", "-o", "v.wav", "--seconds", "0.1")
        self.assertIn("A4     440.00 Hz", shown)
        rate, samples = self.read_wave("v.wav")
        self.assertEqual(len(samples), 4 * int(0.1 * rate))
        self.assertGreater(max(samples), 5000)


class Ditdah(Sample):
    def test_writes_and_reads_morse(self):
        code = self.run_app("Ditdah", "encode", "SOS", "now!").strip()
        self.assertEqual(code, "... --- ... / -. --- .-- -.-.--")
        self.assertEqual(self.run_app("Ditdah", "decode", code).strip(), "SOS NOW!")

    def test_sounds_it(self):
        self.run_app("Ditdah", "sound", "ET", "-o", "et.wav", "--wpm", "20")
        rate, samples = self.read_wave("et.wav")
        self.assertAlmostEqual(len(samples) / rate, (1 + 1 + 2 + 3 + 1) * 0.06, places=2)

    def test_drills(self):
        shown = self.run_app("Ditdah", "drill", "--seed", "3", "--rounds", "2", stdin="u\nq\n")
        self.assertIn("right", shown)
        self.assertIn("no, P", shown)
        self.assertIn("1 of 2 right", shown)


class Jot(Sample):
    def test_keeps_a_list(self):
        self.run_app("Jot", "add", "buy bread")
        self.run_app("Jot", "add", "call & ask / why")
        self.assertIn("1 of 2 to be done", self.run_app("Jot", "done", "1"))
        self.assertEqual(self.run_app("Jot", "tidy"),
                         "  1  [ ] call & ask / why\n1 of 1 to be done\n")
        self.assertIn("there is no line 9", self.run_app("Jot", "drop", "9", code=1))
        self.assertEqual(self.run_app("Jot", "drop", "1"), "Nothing to be done.\n")


class Kaleido(Sample):
    def test_draws_the_same_picture_for_the_same_seed(self):
        for name in ("a.svg", "b.svg"):
            self.run_app("Kaleido", "--seed", "7", "--folds", "9", "-o", name)
        self.assertEqual((self.folder / "a.svg").read_text(), (self.folder / "b.svg").read_text())
        picture = ET.parse(self.folder / "a.svg").getroot()
        self.assertEqual(len(picture.findall("{http://www.w3.org/2000/svg}use")), 18)


class Lantern(Sample):
    def test_can_be_won(self):
        moves = ("e, take lamp, take matches, light lamp, w, n, n, w, d, take key, u, e, use key, n, "
                 "d, take oil, u, u, light lantern")
        shown = self.run_app("Lantern", stdin=moves.replace(", ", "\n") + "\n")
        self.assertIn("The door is locked.", shown)
        self.assertIn("The end, in 19 moves.", shown)

    def test_is_lost_in_the_dark_without_a_lamp(self):
        shown = self.run_app("Lantern", stdin="n\nw\nd\ntake key\n")
        self.assertIn("pitch dark", shown)
        self.assertIn("no such thing", shown)
        self.assertIn("The night stays dark.", shown)


class Lune(Sample):
    def test_knows_the_moon(self):
        shown = self.run_app("Lune", "2024-04-08")
        self.assertIn("new moon, 0% lit", shown)
        self.assertIn("next full moon: 23 April 2024", shown)
        self.assertIn("full moon, 99% lit", self.run_app("Lune", "2024-04-24"))
        self.assertIn("Lune:", self.run_app("Lune", "yesterday", code=1))


class Measure(Sample):
    def test_converts(self):
        self.assertEqual(self.run_app("Measure", "26.2", "mi", "km"), "26.2 mi = 42.1648 km\n")
        self.assertEqual(self.run_app("Measure", "-40", "F", "C"), "-40 F = -40 C\n")
        self.assertIn("measures mass", self.run_app("Measure", "5", "km", "kg", code=1))
        self.assertIn("no unit", self.run_app("Measure", "5", "parsec", "km", code=1))
        self.assertIn("no number", self.run_app("Measure", "five", "m", "km", code=1))


class Meridian(Sample):
    def test_shows_cities_in_winter_and_summer(self):
        for day, paris in (("2024-01-01", "13:00  Mon  1 Jan"), ("2024-07-01", "14:00  Mon  1 Jul")):
            shown = self.run_app("Meridian", "--at", f"{day} 12:00 UTC", "paris", "Tokyo")
            self.assertIn(f"Paris      o {paris}", shown)
            self.assertIn("Tokyo      * 21:00", shown)
        self.assertIn("no city called Atlantis", self.run_app("Meridian", "Atlantis", code=1))


class Nine(Sample):
    def test_makes_puzzles_with_their_solution(self):
        self.run_app("Nine", "--day", "2024-05-11", "--level", "hard", "-o", "page.html")
        page = (self.folder / "page.html").read_text()
        puzzle = re.search('puzzle = "([1-9.]{81})"', page)[1]
        solution = re.search('solution = "([1-9]{81})"', page)[1]
        self.assertNotIn("{{", page)
        self.assertTrue(all(p in (".", s) for p, s in zip(puzzle, solution)))
        self.assertLess(81 - puzzle.count("."), 32)
        for line in range(9):
            row = solution[9 * line:9 * line + 9]
            corner = 27 * (line // 3) + 3 * (line % 3)
            box = "".join(solution[corner + 9 * r:corner + 9 * r + 3] for r in range(3))
            for nine in (row, solution[line::9], box):
                self.assertEqual(sorted(nine), list("123456789"))


class Seahorse(Sample):
    def test_draws_in_the_terminal(self):
        lines = self.run_app("Seahorse", "--text").splitlines()
        self.assertEqual(len(lines), 21)
        self.assertIn("###", lines[10])
        self.assertNotIn("###", lines[0])

    def test_its_page_is_whole(self):
        page = pathlib.Path(self.run_app("Seahorse", "--page").strip())
        open_tags = []

        class Reader(html.parser.HTMLParser):
            def handle_starttag(self, tag, attributes):
                if tag != "meta":
                    open_tags.append(tag)

            def handle_endtag(self, tag):
                assert open_tags.pop() == tag

        Reader().feed(page.read_text())
        self.assertEqual(open_tags, [])


class Stillwater(Sample):
    def test_mixes_its_loops(self):
        app = self.folder / "Stillwater"
        app.write_text((bundle("Stillwater") / "Stillwater").read_text())
        (self.folder / "loops").mkdir()
        for name, level in (("low", 1000), ("high", 3000)):
            with wave.open(str(self.folder / "loops" / f"{name}.wav"), "wb") as loop:
                loop.setparams((1, 2, 8000, 0, "NONE", ""))
                loop.writeframes(level.to_bytes(2, "little") * 4000)
        run = ["python3", "-B", app]
        self.assertIn("high", subprocess.check_output(run, text=True))
        subprocess.run([*run, "mix", "low", "high:0.5", "-o", "mix.wav", "--seconds", "1"],
                       cwd=self.folder, check=True, capture_output=True)
        rate, samples = self.read_wave("mix.wav")
        self.assertEqual((rate, len(samples)), (8000, 8000))
        self.assertEqual(set(samples), {int(2500 / 1.5)})


if __name__ == "__main__":
    unittest.main()
