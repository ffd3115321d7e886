#!/usr/bin/env python3
"""Checks that every #include follows the layers: arrows only ever point down to platform/.

    host/                                              may include all below but the plug-in; of
                                                       device/ only its door, and only in cli/
    device/                                            may include all below but the plug-in
    phone/ packages/ icons/                            may include base/, platform/
    base/                                              may include platform/
    client/ sync/ transfer/ coordination/ restore/     the plug-in, may include platform/ and itself
    platform/                                          may include nothing of the others

Inside device/ and host/ each folder may include only those that stand before it in ORDER; the files
beside device/'s folders put everything together, and no folder knows them.

Locks are those of platform/mutex.h everywhere, since the compiler checks them.

The plug-in and platform/ see no header but those of the C++ standard library. The one exception is
the property-list codec, which alone may include libplist, and <locale.h> to shield it from the
process's locale.

usage: check_layers.py [ROOT]        exit 0: all is well, 1: violations, one per line
"""

import pathlib
import re
import sys

PLUGIN = {"client", "sync", "transfer", "coordination", "restore"}
LAYERS = PLUGIN | {"platform", "base", "icons", "packages", "phone", "device", "host"}
MAY_INCLUDE = {folder: PLUGIN | {"platform"} for folder in PLUGIN} | {
    "platform": {"platform"},
    "base": {"base", "platform"},
    "icons": {"icons", "base", "platform"},
    "packages": {"packages", "base", "platform"},
    "phone": {"phone", "base", "platform"},
    "device": {"device", "phone", "packages", "icons", "base", "platform"},
    "host": {"host", "device", "phone", "packages", "icons", "base", "platform"},
}
ORDER = {
    "device": "files state journal home services apps coordination".split(),
    "host": "library report phone home_screen drawing transfer sync backup restore cli".split(),
}
# A phone is a folder only to the commands; all else sees it through phone/.
DOOR = "device/embedded_device.h"
STANDARD_ONLY = PLUGIN | {"platform"}
PLIST_FILE = "platform/property_list_codec.cpp"
PLIST_HEADERS = {"plist/plist.h", "locale.h"}
LOCKS_FILE = "platform/mutex.h"
LOCKS_HEADERS = {"mutex", "shared_mutex", "condition_variable"}

STANDARD = set(
    """algorithm any array atomic barrier bit bitset charconv chrono codecvt compare complex concepts
    condition_variable coroutine deque exception execution filesystem format forward_list fstream
    functional future initializer_list iomanip ios iosfwd iostream istream iterator latch limits list
    locale map memory memory_resource mutex new numbers numeric optional ostream queue random ranges
    ratio regex scoped_allocator semaphore set shared_mutex source_location span sstream stack
    stdexcept stop_token streambuf string string_view strstream syncstream system_error thread tuple
    type_traits typeindex typeinfo unordered_map unordered_set utility valarray variant vector version
    cassert cctype cerrno cfenv cfloat cinttypes climits clocale cmath csetjmp csignal cstdarg cstddef
    cstdint cstdio cstdlib cstring ctime cuchar cwchar cwctype""".split()
)
INCLUDE = re.compile(r'^[ \t]*#[ \t]*(?:include|import)\b[ \t]*(?:<([^>]*)>|"([^"]*)"|(.*))', re.M)
COMMENT = re.compile(r'//[^\n]*|/\*.*?\*/|("(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])*\')', re.S)


def includes(text):
    """(line number, header, written in quotes) of each include outside comments."""
    blanked = COMMENT.sub(lambda m: m.group(1) or "\n" * m.group(0).count("\n"), text)
    blanked = blanked.replace("\\\n", "")
    for match in INCLUDE.finditer(blanked):
        line = blanked.count("\n", 0, match.start()) + 1
        angled, quoted, computed = match.groups()
        yield line, angled or quoted or computed.strip(), quoted is not None


def out_of_order(path, header):
    """What is wrong between the folders of one layer, or None."""
    top, *inside, _ = path.split("/")
    _, *there, _ = header.split("/")
    order = ORDER[top]
    for folder in inside[:1] + there[:1]:
        if folder not in order:
            return f"{top}/{folder}/ has no place in the order of {top}/"
    if not inside or there and order.index(there[0]) <= order.index(inside[0]):
        return None
    return f"{top}/{inside[0]}/ must not know {'/'.join([top, *there[:1]])}/"


def problem(path, header, quoted):
    """What is wrong with this include in this file (both relative to the root), or None."""
    folder = path.split("/")[0]
    top = header.split("/")[0]
    if ".." in header.split("/"):
        return "includes go from the root of the repository"
    if top in LAYERS and "/" in header:
        if top not in MAY_INCLUDE[folder]:
            return f"{folder}/ must not know {top}/"
        at_the_door = header == DOOR and path.startswith("host/cli/")
        if folder == "host" and top == "device" and not at_the_door:
            return f"only host/cli/ may include {DOOR}, and nothing else of device/"
        return out_of_order(path, header) if top == folder and top in ORDER else None
    if quoted:
        return "own headers are included as \"folder/name.h\""
    if path == PLIST_FILE and header in PLIST_HEADERS:
        return None
    if top == "plist":
        return f"only {PLIST_FILE} may use libplist"
    if header in LOCKS_HEADERS and path != LOCKS_FILE:
        return f"locks are those of {LOCKS_FILE}"
    if folder in STANDARD_ONLY and header not in STANDARD:
        return f"{folder}/ may use no header but those of the C++ standard library"
    return None


def check(root):
    problems, files = [], 0
    for folder in sorted(LAYERS):
        for path in sorted((root / folder).rglob("*")):
            if path.suffix not in {".h", ".hpp", ".cpp", ".cc", ".inc"}:
                continue
            files += 1
            name = path.relative_to(root).as_posix()
            for line, header, quoted in includes(path.read_text()):
                what = problem(name, header, quoted)
                if what:
                    problems.append(f"{name}:{line}: {header}: {what}")
    return files, problems


def main():
    root = pathlib.Path(sys.argv[1] if len(sys.argv) > 1 else pathlib.Path(__file__).parents[1])
    files, problems = check(root)
    if files == 0:
        sys.exit(f"{root}: no sources found")
    for line in problems:
        print(line)
    print(f"layers: {files} files, {len(problems)} violations")
    sys.exit(1 if problems else 0)


if __name__ == "__main__":
    main()
