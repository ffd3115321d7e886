#!/usr/bin/env python3
"""Compiles all that we ship with clang, without making objects: it checks what each mutex guards
(platform/mutex.h says how that is written), and that every file names the headers that it uses.

usage: check_locks.py BUILD        a configured build with clang; exit 0: no warning, 1: some
"""

import concurrent.futures
import json
import os
import pathlib
import shlex
import subprocess
import sys

NOT_SHIPPED = {"tests", "bench", "fuzz"}


def shipped(commands):
    """Folder, file and the compiler's arguments of each source of what we ship."""
    for command in commands:
        arguments = shlex.split(command["command"])
        output = arguments.index("-o")
        if arguments[output + 1].split("/")[0] not in NOT_SHIPPED:
            del arguments[output : output + 2]
            yield command["directory"], command["file"], arguments


def complaints(directory, arguments):
    """What the compiler says of one file; nothing when all is well."""
    result = subprocess.run(
        [*arguments, "-fsyntax-only"],
        cwd=directory,
        stdout=subprocess.PIPE,
        stderr=subprocess.STDOUT,
        text=True,
    )
    return result.stdout or ("" if result.returncode == 0 else "the compiler failed\n")


def main():
    if len(sys.argv) != 2:
        sys.exit(__doc__)
    commands = json.loads(pathlib.Path(sys.argv[1], "compile_commands.json").read_text())
    sources = list(shipped(commands))
    failed = 0
    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        said = pool.map(lambda source: complaints(source[0], source[2]), sources)
        for (_, file, _), text in zip(sources, said):
            if text:
                failed += 1
                print(f"{file}:\n{text}", end="", flush=True)
    print(f"locks: {len(sources)} files, {failed} with warnings")
    sys.exit(1 if failed or not sources else 0)


if __name__ == "__main__":
    main()
