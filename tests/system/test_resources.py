"""What the service uses: nothing while idle, bounded memory under a flood; and no client is
starved."""

import os
import shutil
import socket
import statistics
import threading
import time
import unittest

from harness import Client, Service, wait_for
from test_hostile import AUTHENTICATION, dictionary_body, frame, receive_frame

IDLE_SECONDS = 10
MANY_MESSAGES = 100_000
FLOOD_SECONDS = 5


class Resources(unittest.TestCase):
    def setUp(self):
        self.service = Service()
        self.service.start()
        self.addCleanup(shutil.rmtree, self.service.directory, True)
        self.addCleanup(self.service.stop)

    def client(self):
        client = Client.to_socket(self.service.address)
        self.addCleanup(client.close)
        return client

    def test_idle_service_with_idle_clients_does_not_wake_up(self):
        clients = [self.client() for _ in range(20)]
        for number, client in enumerate(clients):
            client.create(number + 1)
            client.start_later(number + 1)
            client.send({"a": 1}, reporters=[number + 1])
        self.service.wait_for_events(40)
        settled = self.settled_switches()

        time.sleep(IDLE_SECONDS)  # the duration of the measurement, not a wait for an event

        self.assertEqual(self.service.voluntary_switches() - settled, 0)

    def settled_switches(self):
        """Waits until the count has not changed for a second, and returns it."""
        count = self.service.voluntary_switches()
        for _ in range(30):
            time.sleep(1)
            now = self.service.voluntary_switches()
            if now == count:
                return now
            count = now
        self.fail("the service does not become idle")

    def test_flood_is_bounded_and_others_are_still_answered(self):
        quiet = self.client()
        idle = self.latencies(quiet, 300)
        memory = self.service.memory_kib()
        flooder = Flooder(self.service)
        self.addCleanup(flooder.stop)

        under_flood = self.latencies(quiet, 300)
        time.sleep(FLOOD_SECONDS)  # give it time to grow
        grown = self.service.memory_kib() - memory
        flooder.stop()

        self.assertGreater(flooder.bytes_sent, 100_000, "there was no flood")
        self.assertLess(grown, 200 * 1024)
        print(f"\np99 idle {percentile(idle, 99) * 1e6:.0f} us, "
              f"under flood {percentile(under_flood, 99) * 1e6:.0f} us; grown {grown} KiB", flush=True)

    @unittest.skipIf(os.environ.get("HALVOX_SANITIZE"), "sanitizers keep freed memory")
    def test_memory_of_a_long_session_is_given_back_when_it_ends(self):
        client = self.client()
        client.create(1)
        client.start_later(1)
        self.record(100)
        before = self.service.memory_kib()

        self.record(MANY_MESSAGES)
        client.stop(1)  # makes the summaries, from the whole history
        client.destroy(1)

        # The history, the summaries and their JSON text took 29 MiB together. What remains is mostly
        # that of the store.
        wait_for("the memory", lambda: self.service.memory_kib() - before < 16 * 1024)

    def record(self, count):
        """Sends messages for all active sessions, each different from the one before."""
        frames = [frame(dictionary_body(b"key", b"%060d" % number)) for number in range(1000)]
        with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as raw:
            raw.connect(str(self.service.socket))
            raw.sendall(AUTHENTICATION)
            greeting = b""
            while not (b"OK " in greeting and greeting.endswith(b"\r\n")):
                greeting += raw.recv(100)
            reader = threading.Thread(target=self.read_replies, args=(raw, count))
            reader.start()
            for first in range(0, count, len(frames)):
                raw.sendall(b"".join(frames[:count - first]))
            reader.join()

    def read_replies(self, raw, count):
        for _ in range(count):
            receive_frame(raw)

    def latencies(self, client, count):
        taken = []
        for _ in range(count):
            begin = time.perf_counter()
            client.valid(1)
            taken.append(time.perf_counter() - begin)
        return taken


class Flooder:
    """Pipelines requests as fast as the socket accepts them, and reads no reply."""

    def __init__(self, service):
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._socket.connect(str(service.socket))
        self._socket.sendall(AUTHENTICATION)
        self.bytes_sent = 0
        self._stopping = threading.Event()
        self._socket.settimeout(0.2)
        self._thread = threading.Thread(target=self._run)
        self._thread.start()

    def _run(self):
        batch = frame(dictionary_body(b"key", b"value")) * 100
        while not self._stopping.is_set():
            try:
                self.bytes_sent += self._socket.send(batch)
            except TimeoutError:
                continue  # the service stops reading, as it should

    def stop(self):
        self._stopping.set()
        self._thread.join()
        self._socket.close()


def percentile(values, percent):
    return statistics.quantiles(values, n=100)[percent - 1]


if __name__ == "__main__":
    unittest.main()
