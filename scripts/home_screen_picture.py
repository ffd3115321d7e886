#!/usr/bin/env python3
"""Draws docs/home-screen.png: a phone halfway through a sync, and after it.

Uses build/release/appsync and the library that ./dev demo has made.
"""

import fcntl
import json
import os
import pathlib
import subprocess
import tempfile

ROOT = pathlib.Path(__file__).resolve().parents[1]
APPSYNC = ROOT / "build/release/appsync"
LIBRARY = ROOT / "build/demo/library/second"
ORDER = ["tally", "lantern", "nine", "seahorse", "ditdah", "stillwater", "kaleido", "jot", "measure",
         "lune", "meridian", "concord"]
LAST_BEFORE, LARGE = "org.example.jot", "org.example.stillwater"
WIDTH, HEIGHT, GAP, SCALE = 752, 1336, 48, 0.7

PAIR = f"""<svg xmlns="http://www.w3.org/2000/svg" xmlns:xlink="http://www.w3.org/1999/xlink"
  width="{(2 * WIDTH + GAP) * SCALE:.0f}" height="{HEIGHT * SCALE:.0f}"
  viewBox="0 0 {2 * WIDTH + GAP} {HEIGHT}">
<image xlink:href="halfway.png" width="{WIDTH}" height="{HEIGHT}"/>
<image xlink:href="after.png" x="{WIDTH + GAP}" width="{WIDTH}" height="{HEIGHT}"/>
</svg>"""


def sync_until_halfway(sync):
    """Sends some small applications, then a large one that the person taps, and is killed there."""
    process = subprocess.Popen([*sync, "--verbose"], stdout=subprocess.PIPE, bufsize=0)
    # A short pipe keeps the sync from running far ahead of what is read here.
    fcntl.fcntl(process.stdout, fcntl.F_SETPIPE_SZ, 4096)
    for line in process.stdout:
        event = json.loads(line)
        if event["event"] == "transfer-ended" and event["identifier"] == LAST_BEFORE:
            subprocess.run([APPSYNC, "--quiet", "tap", LARGE], check=True)
        if event["event"] == "transfer" and event["identifier"] == LARGE:
            if event["sent"] > 0.3 * event["total"]:
                break
    process.kill()
    process.wait()


def main():
    with tempfile.TemporaryDirectory() as name:
        folder = pathlib.Path(name)
        os.environ["APPSYNC_DEVICE"] = str(folder / "phone")
        layout = folder / "layout.json"
        layout.write_text(json.dumps([f"org.example.{app}" for app in ORDER]))
        sync = [APPSYNC, "--json", "sync", LIBRARY, "--icon-layout", layout]
        subprocess.run([APPSYNC, "--quiet", "init", "--coordination", "on"], check=True)
        sync_until_halfway(sync)
        subprocess.run([APPSYNC, "--quiet", "home-screen", "-o", folder / "halfway.png"], check=True)
        subprocess.run(sync, check=True, stdout=subprocess.DEVNULL)
        subprocess.run([APPSYNC, "--quiet", "home-screen", "-o", folder / "after.png"], check=True)
        (folder / "pair.svg").write_text(PAIR)
        subprocess.run(["rsvg-convert", folder / "pair.svg", "-o", ROOT / "docs/home-screen.png"],
                       check=True)


if __name__ == "__main__":
    main()
