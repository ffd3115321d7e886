"""Making packages."""

import os
import subprocess
import tarfile
import time
import zipfile

import support


class Package(support.Case):
    def package(self, bundle, name, code=0):
        return self.run_appsync("--json", "package", bundle, "-o", self.folder / name, code=code)[0]

    def test_other_archivers_read_it(self):
        bundle = self.bundle("com.a", body=b"text " * 1000)
        self.package(bundle, "a.zip")
        with zipfile.ZipFile(self.folder / "a.zip") as package:
            self.assertIsNone(package.testzip())
            self.assertEqual(package.read("A.app/body"), b"text " * 1000)
            self.assertEqual(package.getinfo("A.app/run").external_attr >> 16 & 0o777, 0o755)
        subprocess.run(["unzip", "-tq", self.folder / "a.zip"], check=True,
                       stdout=subprocess.DEVNULL)
        for ending in ("gz", "xz", "bz2"):
            self.package(bundle, f"a.tar.{ending}")
            with tarfile.open(self.folder / f"a.tar.{ending}") as package:
                self.assertEqual(package.getnames(),
                                 ["A.app", "A.app/Info.plist", "A.app/body", "A.app/run"])
        self.package(bundle, "a.tar.zst")
        listed = subprocess.check_output(["tar", "--zstd", "-tf", self.folder / "a.tar.zst"])
        self.assertIn(b"A.app/run", listed)

    def test_the_same_folder_gives_the_same_bytes_anywhere(self):
        bundle = self.bundle("com.a")
        for ending in (".zip", ".tar.gz", ".tar.xz", ".tar.zst", ".tar.bz2"):
            made = []
            for zone in ("Pacific/Kiritimati", "America/Los_Angeles"):
                self.environment["TZ"] = zone
                self.environment["LC_ALL"] = "C"
                os.utime(bundle / "run", (time.time(), time.time() - 86400 * len(made)))
                self.package(bundle, "a" + ending)
                made.append((self.folder / ("a" + ending)).read_bytes())
            self.assertEqual(*made, ending)

    def test_what_is_wrong_is_said_in_one_line(self):
        bundle = self.bundle("com.a")
        (bundle / "link").symlink_to("run")
        self.assertIn("link is a link", self.package(bundle, "a.zip", code=1))
        (bundle / "link").unlink()
        (bundle / "run").unlink()
        self.assertIn("names the executable", self.package(bundle, "a.zip", code=1))
        self.assertIn("must end in", self.package(bundle, "a.rar", code=1))
        self.assertFalse((self.folder / "a.zip").exists())

    def test_names_of_every_script(self):
        bundle = self.bundle("com.a")
        (bundle / "índice 写真.html").write_text("hello")
        self.environment["LC_ALL"] = "C"
        self.library.mkdir(exist_ok=True)
        self.init()
        for ending in (".zip", ".tar.gz"):
            package = self.library / ("a" + ending)
            self.run_appsync("package", bundle, "-o", package)
            self.run_appsync("sync", self.library, "--install", "com.a")
            path = self.phone / "root" / self.json_lines("apps")[0]["path"].lstrip("/")
            self.assertTrue((path / "índice 写真.html").exists(), ending)
            package.unlink()


if __name__ == "__main__":
    support.main()
