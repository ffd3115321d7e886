"""The layering check lets the sources pass and catches each kind of violation."""

import pathlib
import subprocess
import sys
import tempfile
import unittest

ROOT = pathlib.Path(__file__).resolve().parents[2]
CHECK = ROOT / "scripts" / "check_layers.py"


def run(root):
    done = subprocess.run([sys.executable, "-B", CHECK, root], capture_output=True, text=True)
    return done.returncode, done.stdout + done.stderr


class Layers(unittest.TestCase):
    def check(self, path, text):
        """Runs the check over a tree that holds this one file."""
        with tempfile.TemporaryDirectory() as folder:
            file = pathlib.Path(folder, path)
            file.parent.mkdir(parents=True)
            file.write_text(text)
            return run(folder)

    def assertRefused(self, path, text, reason):
        code, output = self.check(path, text)
        self.assertEqual(code, 1, output)
        self.assertIn(reason, output)

    def assertAllowed(self, path, text):
        code, output = self.check(path, text)
        self.assertEqual(code, 0, output)

    def test_the_sources_keep_the_rule(self):
        code, output = run(ROOT)
        self.assertEqual(code, 0, output)

    def test_plugin_must_not_know_device_or_host(self):
        for header in ("device/registry.h", "host/session.h"):
            self.assertRefused("sync/a.cpp", f'#include "{header}"\n', "sync/a.cpp:1")

    def test_plugin_uses_no_system_header(self):
        for header in ("unistd.h", "sys/stat.h", "sqlite3.h", "archive.h", "fmt/core.h", "linux/fs.h"):
            self.assertRefused("client/a.cpp", f"#include <{header}>\n", "standard library")

    def test_locks_are_those_that_the_compiler_checks(self):
        self.assertAllowed("platform/mutex.h", "#include <mutex>\n#include <condition_variable>\n")
        self.assertAllowed("device/a.cpp", '#include "platform/mutex.h"\n')
        for header in ("mutex", "shared_mutex", "condition_variable"):
            self.assertRefused("device/a.h", f"#include <{header}>\n", "platform/mutex.h")

    def test_platform_knows_nobody(self):
        self.assertRefused("platform/a.h", '#include "client/apps_client.h"\n', "must not know")
        self.assertRefused("platform/a.h", "#include <fcntl.h>\n", "standard library")

    def test_device_and_plugin_do_not_know_each_other(self):
        self.assertRefused("device/a.h", '#include "transfer/queue.h"\n', "must not know transfer/")
        self.assertRefused("device/a.h", '#include "host/loader.h"\n', "must not know host/")

    def test_base_knows_only_the_platform_and_the_plugin_does_not_know_it(self):
        self.assertAllowed("base/a.cpp", '#include "platform/log.h"\n#include <unistd.h>\n')
        for header in ("device/b.h", "host/b.h", "client/b.h"):
            self.assertRefused("base/a.h", f'#include "{header}"\n', "must not know")
        for path in ("sync/a.cpp", "platform/a.h"):
            self.assertRefused(path, '#include "base/b.h"\n', "must not know base/")

    def test_rooms_for_what_comes_from_strangers_know_no_device(self):
        self.assertAllowed("icons/a.cpp", '#include "base/b.h"\n#include <png.h>\n')
        self.assertAllowed("packages/a.cpp", '#include "base/b.h"\n#include <archive.h>\n')
        for path in ("icons/a.h", "packages/a.h"):
            self.assertRefused(path, '#include "device/b.h"\n', "must not know device/")
            self.assertRefused(path, '#include "host/b.h"\n', "must not know host/")
        self.assertRefused("packages/a.h", '#include "icons/b.h"\n', "must not know icons/")
        self.assertRefused("base/a.h", '#include "icons/b.h"\n', "must not know icons/")

    def test_host_knows_of_the_device_only_its_door(self):
        self.assertAllowed("host/cli/a.h", '#include "device/embedded_device.h"\n')
        self.assertAllowed("host/sync/a.h", '#include "phone/phone.h"\n')
        self.assertRefused("host/sync/a.h", '#include "device/embedded_device.h"\n', "only host/cli/")
        self.assertRefused("host/cli/a.h", '#include "device/state/b.h"\n', "only host/cli/")
        self.assertRefused("phone/a.h", '#include "device/embedded_device.h"\n', "must not know device/")

    def test_host_meets_the_plugin_only_through_the_platform(self):
        for folder in ("client", "sync", "transfer", "coordination", "restore"):
            self.assertRefused("host/a.cpp", f'#include "{folder}/x.h"\n', "must not know")

    def test_folders_of_a_layer_know_only_those_before_them(self):
        self.assertAllowed("device/apps/a.cpp", '#include "device/state/b.h"\n')
        self.assertAllowed("device/apps/a.cpp", '#include "device/apps/b.h"\n')
        self.assertAllowed("device/a.cpp", '#include "device/coordination/b.h"\n')
        self.assertRefused("device/state/a.cpp", '#include "device/apps/b.h"\n', "must not know device/apps/")
        self.assertRefused("device/apps/a.cpp", '#include "device/b.h"\n', "must not know device/")
        self.assertRefused("host/sync/a.cpp", '#include "host/restore/b.h"\n', "must not know host/restore/")
        self.assertRefused("host/new/a.cpp", '#include "host/library/b.h"\n', "no place in the order")

    def test_only_the_codec_uses_the_property_list_library(self):
        self.assertAllowed("platform/property_list_codec.cpp", "#include <plist/plist.h>\n")
        for path in ("platform/other.cpp", "client/a.cpp", "device/a.cpp", "host/a.cpp"):
            self.assertRefused(path, "#include <plist/plist.h>\n", "libplist")

    def test_disguised_includes_are_seen(self):
        self.assertRefused("sync/a.cpp", '  #  include "host/a.h"\n', "must not know host/")
        self.assertRefused("sync/a.cpp", '/* why */ #include "host/a.h"\n', "must not know host/")
        self.assertRefused("sync/a.cpp", '#include "../host/a.h"\n', "root of the repository")
        self.assertRefused("sync/a.cpp", "#include <host/a.h>\n", "must not know host/")
        self.assertRefused("sync/a.cpp", "#include SOME_HEADER\n", "standard library")

    def test_commented_includes_are_not_seen(self):
        self.assertAllowed("sync/a.cpp", '// #include "host/a.h"\n/*\n#include "host/b.h"\n*/\n')

    def test_what_the_layers_allow(self):
        self.assertAllowed("device/a.cpp", '#include "base/b.h"\n')
        self.assertAllowed("host/a.cpp", '#include "base/b.h"\n')
        self.assertAllowed("sync/a.cpp", '#include "transfer/b.h"\n#include "platform/log.h"\n')
        self.assertAllowed("host/a.cpp", '#include "phone/b.h"\n#include <unistd.h>\n')
        self.assertAllowed("device/a.cpp", '#include "platform/log.h"\n#include <sqlite3.h>\n')
        self.assertAllowed("client/a.cpp", "#include <vector>\n#include <cstdint>\n")

    def test_an_empty_tree_is_no_success(self):
        with tempfile.TemporaryDirectory() as folder:
            code, output = run(folder)
            self.assertEqual(code, 1)
            self.assertIn("no sources", output)


if __name__ == "__main__":
    unittest.main()
