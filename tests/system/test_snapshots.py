"""Leaked haptics sessions make an internal build capture diagnostics, and nothing else does."""

import json
import re
import signal
import subprocess
import time
import unittest
from pathlib import Path

import harness
from harness import CTL, Follower, Service, connect_to_store, require, wait_for

SESSION_GENERIC = 0x08000001
JOULEBOOK = 8
HAPTICS = 3
INTERNAL = "[device]\nInternalBuild = true\n"
NOT_INTERNAL = "[device]\nInternalBuild = false\n"
WITHIN = 10.0  # the seconds within which a capture must end
OWN_NAME = Path("/proc/self/comm").read_text().strip()


def report(seconds):
    return {"Haptic_Active_Hardware_Time_Seconds": float(seconds)}


def snapshots(service):
    """The finished archives, by name. Unfinished ones have other names."""
    return sorted((service.directory / "state" / "snapshots").glob("*.tar.zst"))


def answers(service):
    """The number of snapshot requests that were answered. The next one is accepted after an answer."""
    return service.log().count("Response from ailmentReporter")


def counters(service):
    """The counters of the running service's snapshots, by name."""
    said = len(service.log())
    service.process.send_signal(signal.SIGUSR1)
    # Pieces are logged in the order of their names. The awaited line comes after those of the
    # pieces that are read.
    wait_for("the counters", lambda: "counted snapshots, stored: " in service.log()[said:])
    return {name: int(value) for name, value
            in re.findall(r"counted diagnostics, (.+): (\d+)$", service.log()[said:], re.MULTILINE)}


class HapticsClient:
    """A client with a haptics session that it reports as left running."""

    def __init__(self, service):
        self.client = service.client()
        self.client.create(7)
        self.client.set_type(HAPTICS, 7)

    def send(self, message):
        self.client.send(message, category=SESSION_GENERIC, event_type=JOULEBOOK, reporters=[7])


class Snapshots(unittest.TestCase):
    def service(self, config):
        service = Service(config + '[log]\nlevel = "info"\n')
        self.addCleanup(service.__exit__, None, None, None)
        return service.start()

    def take_one(self, service):
        haptics = HapticsClient(service)
        haptics.send(report(1))
        self.assertEqual(snapshots(service), [])
        haptics.send(report(2))
        wait_for("an answer", lambda: answers(service) == 1)
        self.assertEqual(len(snapshots(service)), 1, service.log())
        return haptics, snapshots(service)[0]

    def test_two_reports_leave_one_readable_archive_with_the_signature(self):
        require("tar", "zstd")
        service = self.service(INTERNAL)

        _, archive = self.take_one(service)

        listed = subprocess.run(["tar", "--zstd", "-tf", archive], check=True, capture_output=True,
                                text=True).stdout.splitlines()
        for name in ("signature.json", "state.json", "log.txt", "process.json", "system.json", "manifest.json"):
            self.assertIn(name, listed)
        self.assertRegex(archive.name, r"^\d{8}T\d{6}Z-haptics-Session_Generic\.tar\.zst$")
        self.assertEqual(archive.stat().st_mode & 0o7777, 0o600)
        self.assertEqual(self.content(archive, "signature.json"), {
            "Domain": "Acoustat",
            "Type": "haptics",
            "SubType": "Session_Generic",
            "SubtypeContext": "Joulebook",
            "DetectedProcess": OWN_NAME,
        })

    def test_a_sender_that_renames_itself_is_reported_under_its_new_name(self):
        service = self.service(INTERNAL)
        haptics = HapticsClient(service)
        name = Path("/proc/self/comm")
        self.addCleanup(name.write_text, OWN_NAME)
        haptics.send(report(1))
        wait_for("the counted report", lambda: f"Incrementing VEK counter. {OWN_NAME}" in service.log())

        name.write_text("renamed player")
        haptics.send(report(2))

        wait_for("an answer", lambda: answers(service) == 1)
        signature = self.content(snapshots(service)[0], "signature.json")
        self.assertEqual(signature["DetectedProcess"], "renamed player")

    def test_archive_holds_the_state_of_the_service_and_of_the_process(self):
        require("tar", "zstd")
        service = self.service(INTERNAL)

        _, archive = self.take_one(service)

        clients = self.content(archive, "state.json")["clients"]
        self.assertEqual(len(clients), 1)
        self.assertEqual(clients[0]["process_name"], OWN_NAME)
        self.assertIn("reporterID=7", clients[0]["sessions"][0])
        process = self.content(archive, "process.json")
        self.assertEqual(process["name"], OWN_NAME)
        self.assertNotIn("environ", json.dumps(process))
        self.assertIn("release", self.content(archive, "system.json")["kernel"])
        log = self.text(archive, "log.txt")
        self.assertIn("Getting snapshot with Ailment Reporter", log)
        manifest = self.content(archive, "manifest.json")
        for item in manifest["items"]:
            self.assertTrue(item["collected"] or item["reason"], item)
        self.assertLess(manifest["seconds"], WITHIN)

    def test_reply_in_the_log_names_the_file_its_size_and_the_time(self):
        service = self.service(INTERNAL)

        _, archive = self.take_one(service)

        line = wait_for("the reply", lambda: next(
            (line for line in service.log().splitlines() if "Response from ailmentReporter" in line), None))
        self.assertIn(str(archive), line)
        self.assertIn(f"size_bytes = {archive.stat().st_size}", line)
        # The service measures the time from the request to the file with its final name.
        self.assertLess(float(re.search(r" seconds = ([0-9.e-]+)", line)[1]), WITHIN)

    def test_snapshot_is_recorded_and_followed(self):
        service = self.service(INTERNAL)
        haptics, first = self.take_one(service)
        follower = Follower(service, "snapshots")
        self.addCleanup(follower.close)
        self.assertEqual(follower.records(1)[0]["path"], str(first))

        haptics.send(report(3))
        haptics.send(report(4))
        records = follower.records(2)

        self.assertEqual(records[0]["path"], str(first))
        self.assertCountEqual([record["path"] for record in records],
                              [str(path) for path in snapshots(service)])
        for record in records:
            self.assertEqual(record["signature"]["DetectedProcess"], OWN_NAME)
        self.assertEqual(follower.leave(), 0)
        with connect_to_store(service.database) as store:
            stored = store.execute("SELECT time, signature, path FROM snapshots ORDER BY time").fetchall()
        self.assertEqual([(json.loads(signature)["SubtypeContext"], path) for _, signature, path in stored],
                         [("Joulebook", record["path"]) for record in records])
        self.assertLess(abs(stored[0][0] - first.stat().st_mtime), 2 * WITHIN)

    def test_other_builds_never_take_one(self):
        for config in (NOT_INTERNAL, ""):
            with self.subTest(config):
                service = self.service(config)
                haptics = HapticsClient(service)
                for seconds in range(20):
                    haptics.send(report(seconds))
                # If these reports had requested a snapshot, the request would have come before the
                # last answer. Its archive would exist at the latest when the service has ended.
                self.assertEqual(service.stop(), 0)
                self.assertEqual(snapshots(service), [])
                self.assertNotIn("snapshot", service.log())

    def test_other_messages_never_take_one(self):
        service = self.service(INTERNAL)
        client = service.client()
        client.create(7)
        for number in range(20):
            client.send({"EngineOnTime": number}, category=SESSION_GENERIC, event_type=JOULEBOOK,
                        reporters=[7])
            client.send(report(number), category=SESSION_GENERIC, event_type=1, reporters=[7])

        self.assertEqual(service.stop(), 0)
        self.assertEqual(snapshots(service), [])

    def test_flood_leaves_at_most_one_in_work_and_the_service_responsive(self):
        service = self.service(INTERNAL)
        haptics = HapticsClient(service)
        other = service.client()
        directory = service.directory / "state" / "snapshots"
        waited = []
        most_in_work = 0
        for number in range(10_000):
            haptics.send(report(number))
            if number % 100 == 0:
                begun = time.monotonic()
                other.valid(7)
                waited.append(time.monotonic() - begun)
                most_in_work = max(most_in_work, len(list(directory.glob(".*"))))

        self.assertLessEqual(most_in_work, 1)
        # A busy machine may delay some answers, but not most of them.
        self.assertLess(sorted(waited)[len(waited) * 3 // 4], 1.0, waited)
        # Two reports make one request. Each request was accepted or refused, and that was logged.
        counted = wait_for("the end of the last snapshot", lambda: next(
            (now for now in [counters(service)]
             if now["delivered"] + now["dropped: another in progress"] == 5000), None), pause=0.2)
        self.assertEqual(counted["received"], 5000)
        self.assertGreater(counted["delivered"], 0)
        # Requests continued while a capture was running.
        self.assertGreater(counted["dropped: another in progress"], 0)
        self.assertEqual(service.stop(), 0)
        self.assertEqual(len(snapshots(service)), min(counted["delivered"], 20))

    def test_at_most_the_configured_number_is_kept(self):
        service = self.service(INTERNAL + "[diagnostics]\nkeep_snapshots = 2\n")
        haptics, first = self.take_one(service)
        for number in range(3):
            before = answers(service)
            haptics.send(report(100 + 2 * number))
            haptics.send(report(101 + 2 * number))
            wait_for("the next answer", lambda: answers(service) > before)

        self.assertEqual(service.log().count("snapshot taken: "), 4)
        self.assertEqual(len(snapshots(service)), 2)
        self.assertNotIn(first, snapshots(service))

    def test_directory_in_the_way_is_an_error_line_until_it_is_removed(self):
        service = self.service(INTERNAL)
        place = service.directory / "state" / "snapshots"
        place.write_text("in the way")
        haptics = HapticsClient(service)
        haptics.send(report(1))
        haptics.send(report(2))
        wait_for("an error line", lambda: "cannot take a snapshot" in service.log())
        wait_for("the answer", lambda: answers(service) == 1)

        place.unlink()
        haptics.send(report(3))
        haptics.send(report(4))

        wait_for("a snapshot", lambda: snapshots(service))

    def test_end_in_the_middle_leaves_nothing_in_work(self):
        service = self.service(INTERNAL)
        haptics = HapticsClient(service)
        haptics.send(report(1))
        haptics.send(report(2))
        self.assertEqual(service.stop(), 0)

        directory = service.directory / "state" / "snapshots"
        self.assertEqual(list(directory.glob(".*")) if directory.exists() else [], [])

    def test_what_a_killed_service_left_is_removed_at_the_next_start(self):
        service = self.service(INTERNAL)
        left = service.directory / "state" / "snapshots" / ".snapshot-in-work.tmp"
        service.stop(harness.signal.SIGKILL)
        left.parent.mkdir(exist_ok=True)
        left.write_text("half")

        service.start()

        self.assertFalse(left.exists())

    def test_halvoxctl_shows_and_extracts_the_newest(self):
        service = self.service(INTERNAL)
        _, archive = self.take_one(service)

        shown = self.ctl(service, "snapshots", "show", "newest", "--json")
        self.assertEqual(shown.returncode, 0, shown.stderr)
        described = json.loads(shown.stdout)
        self.assertEqual(described["file"], str(archive))
        self.assertEqual(described["signature"]["DetectedProcess"], OWN_NAME)
        text = self.ctl(service, "snapshots", "show", str(archive))
        self.assertIn("SubtypeContext   Joulebook", text.stdout)
        self.assertIn("log.txt", text.stdout)

        target = service.directory / "out"
        extracted = self.ctl(service, "snapshots", "extract", "newest", "--to", str(target))
        self.assertEqual(extracted.returncode, 0, extracted.stderr)
        self.assertEqual(json.loads((target / "signature.json").read_text())["Domain"], "Acoustat")
        again = self.ctl(service, "snapshots", "extract", "newest", "--to", str(target))
        self.assertEqual(again.returncode, 1)
        self.assertIn("the file already exists", again.stderr)

    def ctl(self, service, *arguments):
        return subprocess.run([CTL, *arguments], capture_output=True, text=True, timeout=harness.DEADLINE,
                              env={**harness.os.environ, "HALVOX_CONFIG": str(service.config)})

    def text(self, archive, name):
        return subprocess.run(["tar", "--zstd", "-xOf", archive, name], check=True, capture_output=True,
                              text=True).stdout

    def content(self, archive, name):
        return json.loads(self.text(archive, name))


if __name__ == "__main__":
    unittest.main()
