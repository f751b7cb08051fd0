"""Measures the commands of halvoxctl that read a whole store, and the page of `halvoxctl report`.

    report_cost.py [EVENTS]

Makes a store with halvox_report_store, runs each command five times and opens the page as often in a
headless Chromium. Prints medians, with the load average. HALVOX_BIN names the directory of the
programs. Build them with the preset `release`.
"""

import os
import statistics
import subprocess
import sys
import tempfile
from pathlib import Path

sys.path.insert(0, str(Path(__file__).resolve().parents[2] / "tests" / "system"))

import browser  # noqa: E402
import usage  # noqa: E402

PROGRAMS = Path(os.environ["HALVOX_BIN"]).resolve()
ROUNDS = 5
PAINTS = """({
  "first paint": performance.getEntriesByName("first-contentful-paint")[0]?.startTime,
  "page complete": performance.getEntriesByName("report-ready")[0]?.startTime})"""


def run(*command):
    """Seconds by the clock and of the processor, and the most MiB that were resident."""
    status, *used = usage.run(command)
    if status != 0:
        sys.exit(f"{' '.join(map(str, command))}: status {status}")
    return used


def measure(label, *command):
    rounds = [run(*command) for _ in range(ROUNDS)]
    elapsed, processor, resident = map(statistics.median, zip(*rounds))
    print(f"{label}: {elapsed:.2f} s, processor {processor:.2f} s, {resident:.1f} MiB; "
          f"load average {os.getloadavg()[0]:.1f}", flush=True)


def measure_page(page):
    """A browser of its own each time: a second page would find the first one's program compiled."""
    rounds = []
    for _ in range(ROUNDS):
        with browser.Browser() as one:
            one.open(page)
            one.frames()
            rounds.append(one.evaluate(PAINTS))
    for name in rounds[0]:
        median = statistics.median(each[name] for each in rounds)
        print(f"{name}: {median / 1000:.2f} s; load average {os.getloadavg()[0]:.1f}", flush=True)


def main():
    with tempfile.TemporaryDirectory(prefix="halvox-report-cost-") as directory:
        subprocess.run([PROGRAMS / "halvox_report_store", directory, *sys.argv[1:2]], check=True)
        size = sum(file.stat().st_size for file in Path(directory).iterdir())
        print(f"store: {size / 1e6:.1f} MB")
        ctl, page = PROGRAMS / "halvoxctl", Path(directory) / "report.html"
        measure("report", ctl, "report", "--database", directory, "-o", page)
        print(f"page: {page.stat().st_size / 1e6:.2f} MB")
        measure("streams", ctl, "streams", "--database", directory)
        measure("streams --last 20", ctl, "streams", "--database", directory, "--last", "20")
        if browser.missing():
            print(browser.missing())
        else:
            measure_page(page)


if __name__ == "__main__":
    main()
