#!/usr/bin/env python3
"""Says which tests were skipped, and why: skipped_tests.py LAST_TEST_LOG

The log is that of CTest. CTest itself counts a module of Python tests as passed when all of it was
skipped, and never gives a reason. Prints one line for each test, nothing when there is none.
"""

import re
import sys
from pathlib import Path

TEST = re.compile(r"^\d+/\d+ Test: (.*)$")
OF_PYTHON = re.compile(r"^(\S+) \((\S+)\).* \.\.\. skipped (['\"])(.*)\3$")
# GoogleTest writes the place first, and the reason on the lines after it.
OF_GOOGLETEST = re.compile(r"^\S+:\d+: Skipped$")


def skipped(lines):
    """Each test with its reason, in the order of the log."""
    test = ""
    is_reason = False  # of the line
    for line in lines:
        line = line.rstrip("\n")
        if is_reason:
            yield test, line.strip() or "no reason given"
            is_reason = False
        elif found := TEST.match(line):
            test = found[1]
        elif found := OF_PYTHON.match(line):
            yield f"{test}, {found[1]}", found[4]
        elif OF_GOOGLETEST.match(line):
            is_reason = True


def main():
    log = Path(sys.argv[1])
    if not log.exists():
        return
    with log.open(errors="replace") as lines:
        found = list(skipped(lines))
    if found:
        print(f"{len(found)} skipped:")
    for test, reason in found:
        print(f"  {test}: {reason}")


if __name__ == "__main__":
    main()
