"""Work that nobody waits for has a lower scheduling priority than requests."""

import contextlib
import unittest
from pathlib import Path

from harness import Service, wait_for

MUSIC = 7


def priorities(service):
    """Name and niceness of each thread of the service."""
    found = []
    for task in Path(f"/proc/{service.process.pid}/task").iterdir():
        # A thread may end meanwhile, such as "link callbacks".
        with contextlib.suppress(FileNotFoundError, ProcessLookupError):
            name = (task / "comm").read_text().strip()
            found.append((name, int((task / "stat").read_text().rsplit(")", 1)[1].split()[16])))
    return found


class Priorities(unittest.TestCase):
    def test_link_and_single_messages_give_way_to_requests(self):
        with Service() as service:
            client = service.client()
            self.addCleanup(client.close)
            client.send({"number": 1})  # is sent as a single message
            client.create(7)
            client.set_type(MUSIC, 7)
            client.start_later(7)
            client.send({"number": 2}, reporters=[7])
            wait_for("the threads of the background work",
                     lambda: "pool-background" in dict(priorities(service)), deadline=10)
            found = priorities(service)

        main = next(niceness for name, niceness in found if name.startswith("halvox"))
        lower = {"pool-utility": min(main + 5, 19), "pool-background": min(main + 10, 19)}
        self.assertLessEqual(set(lower), {name for name, _ in found})
        lower["link callbacks"] = lower["pool-utility"]  # may still exist
        for name, niceness in found:
            # The store's writer and the log's are among the others, because requests wait for them.
            self.assertEqual((name, niceness), (name, lower.get(name, main)))


if __name__ == "__main__":
    unittest.main()
