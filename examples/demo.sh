#!/usr/bin/env bash
# Takes the sample library through three desktop syncs of a new phone, and checks what comes out.
# Then a second phone, which installs through coordinators, goes through the same. At the end both
# come back from a backup on new phones.
#
# usage: examples/demo.sh APPSYNC [FOLDER]      FOLDER: where it works, build/demo by default
set -euo pipefail

program=$(realpath "$1")
root=$(realpath "$(dirname "${BASH_SOURCE[0]}")/..")
mkdir -p "${2:-$root/build/demo}"
cd "${2:-$root/build/demo}"
export APPSYNC_DEVICE=$PWD/phone

title() { printf '\n== %s\n' "$*"; }
fail() { printf '\nThe demo failed: %s\n' "$*" >&2 && exit 1; }

# Shows a command as one would type it, runs it, and insists on its exit code.
run() { # EXPECTED_EXIT ARGUMENT...
  local expected=$1 status=0
  shift
  printf '\n$ appsync %s\n' "$*"
  "$program" "$@" || status=$?
  ((status == expected)) || fail "\"appsync $*\" gave exit code $status, not $expected"
}

# The applications of a phone, a line "name version" each, in order.
apps_of() { # DEVICE
  "$program" --device "$1" --json apps | python3 -c '
import json, sys
for line in sys.stdin:
    app = json.loads(line)
    kind = " (placeholder)" if app["placeholder"] else ""
    print(app["identifier"].removeprefix("org.example."), app["version"] + kind)'
}

# Insists on the applications that are installed now.
expect_apps() { # "NAME VERSION"...
  local have
  have=$(apps_of "$APPSYNC_DEVICE")
  diff <(printf '%s\n' "$@") <(printf '%s\n' "$have") >difference ||
    fail "these applications were expected (<) and found (>):"$'\n'"$(cat difference)"
}

# Runs the installed Tally of a phone with its own data there, and insists that it has counted.
run_tally() { # DEVICE ARGUMENT...
  local device=$1 path
  shift
  path=$("$program" --device "$device" --json apps | python3 -c '
import json, sys
print(next(a["path"] for a in map(json.loads, sys.stdin) if a["identifier"] == "org.example.tally"))')
  printf '\n$ Tally %s\n' "$*"
  APP_DATA=$PWD/$device/root/var/mobile/Containers/Data/org.example.tally \
    "$device/root$path/Tally" "$@" | tee output.txt
  grep -q '3  |||' output.txt || fail "Tally does not count"
}

# A person demotes an application; the phone is backed up and comes back as another one, to which
# the store brings the packages.
come_back() { # DEVICE INIT_OPTION...
  local device=$1
  shift
  local -x APPSYNC_DEVICE=$PWD/$device
  rm -rf "backup-$device" "backup-of-restored-$device" "restored-$device"
  run 0 demote org.example.meridian
  run 0 backup "backup-$device"
  apps_of "$APPSYNC_DEVICE" >before.txt

  APPSYNC_DEVICE=$PWD/restored-$device
  run 0 init "$@"
  run 0 restore "backup-$device" --store library/third
  apps_of "$APPSYNC_DEVICE" >after.txt
  paste before.txt after.txt | expand -t 36
  cmp before.txt after.txt || fail "the restored phone holds other applications"
  run_tally "restored-$device"

  run 0 --quiet backup "backup-of-restored-$device"
  diff -r "backup-$device" "backup-of-restored-$device" ||
    fail "a backup of the restored phone is another one"
  run 0 tap org.example.meridian
  run 0 --quiet restore "backup-$device" --store library/third
  apps_of "$APPSYNC_DEVICE" | grep -x "meridian 1.6" >/dev/null ||
    fail "the demoted application that was asked for did not come"
}

title "The sample library: 12 applications, packed by appsync, zip, 7-Zip, Python and tar"
"$root/examples/build-library" "$program" library
ls -sh1 library/first

title "A new phone"
rm -rf phone
run 0 init

title "First sync: one package is damaged, so it fails (exit code 1) and the others are installed"
run 1 sync library/first
run 0 apps
expect_apps "concord 2.3" "ditdah 1.4" "jot 3.0.1" "lantern 1.0" "lune 2.0" "measure 4.1" \
  "meridian 1.6" "nine 2.2" "seahorse 1.1" "stillwater 1.0" "tally 1.0"

title "Second sync: a newer Tally, a mended Kaleido, and Lantern is to go"
run 0 sync library/second --remove org.example.lantern
expect_apps "concord 2.3" "ditdah 1.4" "jot 3.0.1" "kaleido 1.2" "lune 2.0" "measure 4.1" \
  "meridian 1.6" "nine 2.2" "seahorse 1.1" "stillwater 1.0" "tally 1.1"

title "On the phone, the person deletes Jot"
run 0 uninstall org.example.jot

title "Third sync: the phone reports what is gone; the desktop gives up Jot too"
rm -rf library/third
cp -r library/second library/third
rm library/third/Jot.zip library/third/Lantern.tar.xz
run 0 sync library/third
"$program" log >log.txt
grep -F "Marking as deleted" log.txt || fail "the inventory did not report Jot as deleted"
grep -q "org.example.jot not installed.*Marking as deleted" log.txt ||
  fail "the inventory did not report Jot as deleted"

title "An installed application runs"
run_tally phone add "desktop sync" 3

title "What is on the phone now"
run 0 apps
expect_apps "concord 2.3" "ditdah 1.4" "kaleido 1.2" "lune 2.0" "measure 4.1" \
  "meridian 1.6" "nine 2.2" "seahorse 1.1" "stillwater 1.0" "tally 1.1"

title "What happened"
run 0 history
"$program" history | grep -q "removed 1.0 *org.example.lantern *by sync" ||
  fail "the history does not tell that Lantern was removed"

title "The same on a second phone, which installs through coordinators"
rm -rf coordinated
export APPSYNC_DEVICE=$PWD/coordinated
run 0 init --coordination on
run 1 --quiet sync library/first
run 0 --quiet sync library/second --remove org.example.lantern
run 0 --quiet uninstall org.example.jot
run 0 --quiet sync library/third
"$program" status | grep "coordination *on" >/dev/null || fail "the second phone does not coordinate"

title "Both phones side by side: without coordinators, and with them"
apps_of phone >without.txt
apps_of coordinated >with.txt
paste without.txt with.txt | expand -t 24
cmp without.txt with.txt || fail "the two phones hold different applications"

title "A backup of the first phone, and a new phone that comes back from it"
come_back phone

title "The same where installs are coordinated"
run_tally coordinated add "desktop sync" 3
come_back coordinated --coordination on

title "The home screen of the restored phone"
run 0 --device restored-coordinated home-screen -o home-screen.png

printf '\nAll is as it should be. The phones are in %s\n' "$PWD"
