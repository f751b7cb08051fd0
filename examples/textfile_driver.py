#!/usr/bin/python3
"""A daemon whose counters the service reports with each session: a haptic actuator.

    textfile_driver.py DIRECTORY     the directory is that of `drivers.textfiles` in the configuration

Each line of standard input is one pulse: its latency in microseconds. The daemon counts the pulses and
their latencies, and writes a text file after each of them.
"""

import os
import sys

BOUNDS = (500, 1000, 2000)
LABELS = 'driver="ExampleActuator",group="Haptics",subgroup="Stats"'


class Actuator:
    def __init__(self):
        self._pulses = 0
        self._hits = [0] * len(BOUNDS)

    def count(self, latency):
        self._pulses += 1
        for index, bound in enumerate(BOUNDS):
            self._hits[index] += latency <= bound

    def text(self):
        """The counters as OpenMetrics. The buckets are cumulative."""
        lines = ["# TYPE pulses counter", f"pulses_total{{{LABELS}}} {self._pulses}",
                 "# TYPE latency histogram"]
        for bound, hits in (*zip(BOUNDS, self._hits), ("+Inf", self._pulses)):
            lines.append(f'latency_bucket{{{LABELS},unit="us",le="{bound}"}} {hits}')
        return "\n".join([*lines, "# EOF", ""])


def write(directory, text):
    """The file appears complete or not at all: readers never see half of it."""
    new = os.path.join(directory, "actuator.prom.new")
    with open(new, "w", encoding="utf-8") as file:
        file.write(text)
    os.rename(new, os.path.join(directory, "actuator.prom"))


def main():
    if len(sys.argv) != 2:
        sys.exit("usage: textfile_driver.py DIRECTORY")
    actuator = Actuator()
    # Write at once: the service subscribes to the channels that exist when it starts.
    write(sys.argv[1], actuator.text())
    print("ready", flush=True)
    for line in sys.stdin:
        actuator.count(float(line))
        write(sys.argv[1], actuator.text())
        print("written", flush=True)


if __name__ == "__main__":
    main()
