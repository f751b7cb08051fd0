#!/usr/bin/env python3
"""Reads what halvox_stream_reader prints and shows it by subject, a line for each message.

One JSON object a line, in the order of the stream: subject, sequence, id, message.
Exit status 1 when there was none.
"""

import json
import sys

# The tag has a column of its own, and the times are the same in every message.
LEFT_OUT = ("audiotag", "hvreporting_timestamp", "systemuptime_sec", "processuptime_ms")
FIELDS = 3
LONGEST_KEY = LONGEST_VALUE = 30  # characters


def field(key, value):
    """Formats key=value. Shows the end of a long key, which says more than its beginning."""
    text = str(value)
    return "=".join((key if len(key) <= LONGEST_KEY else "…" + key[1 - LONGEST_KEY:],
                     text if len(text) <= LONGEST_VALUE else text[:LONGEST_VALUE - 1] + "…"))


def fields_of(payload):
    """The first fields of a payload, and how many more there are."""
    fields = [field(key, value) for key, value in payload.items() if key not in LEFT_OUT]
    more = f"  (+{len(fields) - FIELDS})" if len(fields) > FIELDS else ""
    return "  ".join(fields[:FIELDS]) + more


def row(record):
    message = record["message"]
    kind = f"{message['category']}/{message['type']}"
    return str(record["sequence"]), kind, message["payload"].get("audiotag", "-"), fields_of(message["payload"])


def print_table(rows):
    widths = [max(len(row[column]) for row in rows) for column in range(len(rows[0]))]
    for cells in rows:
        print("  " + "  ".join(cell.ljust(width) for cell, width in zip(cells, widths)).rstrip())


def main():
    subjects = {}
    for line in sys.stdin:
        record = json.loads(line)
        subjects.setdefault(record["subject"], []).append(record)
    if not subjects:
        print("the stream is empty", file=sys.stderr)
        return 1
    heading = ("no.", "category/type", "tag", "first fields of the payload")
    for subject, records in subjects.items():
        application = records[0]["message"]["userInfo"].get("HostApplicationDisplayID", "?")
        print(f"\n  {subject}, from {application}: {len(records)} messages")
        print_table([heading] + [row(record) for record in records])
    count = sum(len(records) for records in subjects.values())
    identifiers = {record["id"] for records in subjects.values() for record in records}
    print(f"\n  {count} messages with {len(identifiers)} identifiers on {len(subjects)} subjects;"
          "\n  their numbers are their places on the stream")
    return 0


if __name__ == "__main__":
    sys.exit(main())
