"""Prints "N passed, M failed, K skipped" summed over the JUnit reports that ctest wrote."""

import sys
import xml.etree.ElementTree as ET


def main() -> None:
    passed = failed = skipped = 0
    for path in sys.argv[1:]:
        suite = ET.parse(path).getroot()
        bad = int(suite.get("failures", 0))
        left_out = int(suite.get("skipped", 0)) + int(suite.get("disabled", 0))
        failed += bad
        skipped += left_out
        passed += int(suite.get("tests", 0)) - bad - left_out
    print(f"{passed} passed, {failed} failed, {skipped} skipped")


if __name__ == "__main__":
    main()
