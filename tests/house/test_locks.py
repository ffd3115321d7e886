"""The check of locks lets right code pass and catches each kind of mistake. Needs clang."""

import json
import pathlib
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

ROOT = pathlib.Path(__file__).resolve().parents[2]
CHECK = ROOT / "scripts" / "check_locks.py"
CLANG = shutil.which("clang++-14")

CLASS = """
#include "client/queues.h"
#include "platform/mutex.h"
namespace appsync {
class Counter {
 public:
%s
  void helper() APPSYNC_REQUIRES(mutex_) { ++count_; }
  void callOut() {}
  Mutex mutex_;
  Condition changed_;
  int count_ APPSYNC_GUARDED_BY(mutex_) = 0;
  SharedMutex shared_;
  int total_ APPSYNC_GUARDED_BY(shared_) = 0;
  AccessQueue queue_{""};
  int inFlight_ APPSYNC_GUARDED_BY(queue_) = 0;
};
}
"""


@unittest.skipUnless(CLANG, "clang is not installed")
class Locks(unittest.TestCase):
    def check(self, methods, target="device"):
        """Runs the check over a build of one file, a class with methods of these statements."""
        with tempfile.TemporaryDirectory() as build:
            source = pathlib.Path(build, "a.cpp")
            source.write_text(CLASS % "\n".join(
                f"  void method{number}() {{ {body} }}" for number, body in enumerate(methods)))
            command = f"{CLANG} -std=c++20 -Wthread-safety -Werror -I{ROOT} -o {target}/a.o -c {source}"
            entry = {"directory": build, "file": str(source), "command": command}
            pathlib.Path(build, "compile_commands.json").write_text(json.dumps([entry]))
            done = subprocess.run([sys.executable, "-B", CHECK, build], capture_output=True, text=True)
            return done.returncode, done.stdout + done.stderr

    def assertRefused(self, reason, *methods):
        """Each of the methods is refused for the reason."""
        code, output = self.check(methods)
        self.assertEqual(code, 1, output)
        first = CLASS.split("%s")[0].count("\n") + 1
        said = {int(line) - first: text for line, text in re.findall(r"a\.cpp:(\d+):.*error: (.*)", output)}
        for number, body in enumerate(methods):
            self.assertIn(reason, said.get(number, ""), body)

    def test_what_keeps_the_rules_passes(self):
        code, output = self.check(["""
            const Lock lock(mutex_);
            while (count_ == 0) changed_.wait(mutex_);
            helper();
            {
              const Unlock unlocked(mutex_);
              callOut();
            }
            ++count_;
            const SharedLock readers(shared_);
            count_ = total_;
            queue_.sync([this]() APPSYNC_REQUIRES(queue_) { ++inFlight_; });
        """])
        self.assertEqual((code, output), (0, "locks: 1 files, 0 with warnings\n"))

    def test_a_member_is_touched_only_with_its_mutex(self):
        self.assertRefused(
            "requires holding mutex 'mutex_'",
            "++count_;",
            "helper();",
            "changed_.wait(mutex_);",
            "{ const Lock lock(mutex_); } ++count_;",
            "const Lock lock(mutex_); const Unlock unlocked(mutex_); ++count_;",
        )

    def test_a_mutex_is_taken_once_and_let_go_only_when_held(self):
        self.assertRefused("already held", "const Lock lock(mutex_); const Lock again(mutex_);")
        self.assertRefused("that was not held", "const Unlock unlocked(mutex_);")

    def test_readers_that_share_a_mutex_change_nothing(self):
        self.assertRefused("mutex 'shared_' exclusively", "const SharedLock lock(shared_); ++total_;")

    def test_what_tasks_of_the_access_queue_touch_is_theirs_alone(self):
        self.assertRefused(
            "queue 'queue_'", "++inFlight_;", "queue_.sync([this] { ++inFlight_; });")
        self.assertRefused(
            "while mutex 'queue_' is held",
            "queue_.sync([this]() APPSYNC_REQUIRES(queue_) { queue_.sync([] {}); });")

    def test_tests_are_not_looked_at_and_a_build_without_sources_is_refused(self):
        code, output = self.check(["++count_;"], target="tests/device")
        self.assertEqual((code, output), (1, "locks: 0 files, 0 with warnings\n"))


if __name__ == "__main__":
    unittest.main()
