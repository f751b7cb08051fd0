#!/usr/bin/env python3
"""Reads what `halvoxctl events --json` prints and says what each stream did.

One JSON object a line, oldest first: time (seconds since 1970), name, payload. Times played are the
distances between a stream's volume messages, as the reporting service itself counts them.
Exit status 1 when no stream was recorded.
"""

import json
import sys

PREFIX = "com.tarno."
COMMON_SERVICE = "halvox"  # each message is recorded under this and under its service's name


class Stream:
    """What one stream reported; call `add` with its messages in order."""

    def __init__(self, service, application):
        self.service = service
        self.application = application
        self.direction = "?"
        self.format = "?"
        self.devices = "?"
        self.played = []  # [volume, seconds], in order
        self._playing_since = None
        self._volume = None

    def add(self, kind, payload):
        if kind in ("Session_Playback.Start", "Session_Record.Start"):
            self.direction = "playback" if "Playback" in kind else "capture"
        elif kind == "Session_Setup.Setup":
            self.format = payload.get("session_selected_format", "?")
        elif kind == "RouteChange.State":
            self.devices = payload.get("active_devices", "?")
        elif kind == "Volume.State":
            self._change_volume(payload)

    def _change_volume(self, payload):
        now = payload["hvreporting_timestamp"]
        if self._playing_since is not None:
            self._add_played(self._volume, now - self._playing_since)
        self._volume = payload["RQSessionVolume"]
        self._playing_since = now if payload.get("RQSessionVolumePlayingState") else None

    def _add_played(self, volume, seconds):
        if self.played and self.played[-1][0] == volume:
            self.played[-1][1] += seconds
        else:
            self.played.append([volume, seconds])

    def row(self):
        seconds = sum(seconds for _, seconds in self.played)
        volumes = ", ".join(f"{seconds:.1f} s at {volume:.2f}" for volume, seconds in self.played)
        return (self.application, self.service, self.direction, f"{seconds:.1f} s", volumes or "-",
                self.format, self.devices)


def read_streams(lines):
    """The number of messages, and the streams in the order of their first ones."""
    count = 0
    streams = {}
    for line in lines:
        event = json.loads(line)
        service, _, kind = event["name"].removeprefix(PREFIX).partition(".")
        payload = event["payload"]
        if service == COMMON_SERVICE or "object_serial" not in payload:
            continue
        count += 1
        application = payload.get("HostApplicationDisplayID", "?")
        stream = streams.setdefault(payload["object_serial"], Stream(service, application))
        stream.add(kind, payload)
    return count, list(streams.values())


def print_table(rows):
    widths = [max(len(row[column]) for row in rows) for column in range(len(rows[0]))]
    for row in rows:
        print("  " + "  ".join(cell.ljust(width) for cell, width in zip(row, widths)).rstrip())


def main():
    count, streams = read_streams(sys.stdin)
    if not streams:
        print("no stream was recorded", file=sys.stderr)
        return 1
    heading = ("application", "service", "direction", "ran", "at volume", "format", "devices")
    print_table([heading] + [stream.row() for stream in streams])
    print(f"\n  {len(streams)} streams sent {count} messages; the store holds each under two names,"
          "\n  com.tarno.halvox.* and com.tarno.<its service>.*")
    return 0


if __name__ == "__main__":
    sys.exit(main())
