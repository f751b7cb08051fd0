"""What the privacy rules keep out of everything that the service stores or sends."""

import json
import subprocess
import unittest

from harness import Service, connect_to_store, require, wait_for
from nats import DRIVER, Server, try_read_stream

HAPTICS = 3
SESSION_GENERIC, JOULEBOOK = 0x08000001, 8
INTERNAL = '[device]\nInternalBuild = true\n[log]\nlevel = "debug"\nmemory_level = "debug"\n'
RULE = '[privacy]\ndrop_keys = ["home_*", "device_name", "HostApp*"]\n'
# The values of dropped keys, and a value that is kept. None occurs anywhere else.
IN_MESSAGE, IN_BLANK_KEY, NESTED, IN_CONFIGURATION, SETTING = SECRETS = (
    "quietharbour", "stillmeadow", "greenvalley", "brownforest", "whitecastle")
KEPT = "publicsquare"


def report(service, client):
    """A session with secrets in its messages and configuration, on an internal build, which also
    writes a summary file and a snapshot. Ends the service, which then has written everything."""
    preferences = service.directory / "state" / "preferences" / "mobile"
    preferences.mkdir(parents=True)
    (preferences / "com.tarno.halvox.toml").write_text(f'device_name = "{SETTING}"\n')
    client.create(7)
    client.set_type(HAPTICS, 7)
    client.configure({"HostApplicationDisplayID": IN_CONFIGURATION}, 7)
    client.start_later(7)
    secrets = {"home_town": IN_MESSAGE, "home garden": IN_BLANK_KEY, "place": {"home_street": NESTED}}
    client.send({**secrets, "kept": KEPT}, reporters=[7])
    client.send({**secrets, "kept": KEPT, "number": 2})
    for seconds in (1, 2):
        client.send({**secrets, "Haptic_Active_Hardware_Time_Seconds": float(seconds)},
                    category=SESSION_GENERIC, event_type=JOULEBOOK, reporters=[7])
    wait_for("the snapshot", lambda: service.log().count("Response from ailmentReporter") == 1)
    client.stop(7)
    client.send({**secrets, "kept": KEPT})  # without a session
    client.close()


def rows(service):
    """Everything that the database holds, as text. Its files hold it compressed."""
    with connect_to_store(service.database) as database:
        names = [name for (name,) in database.execute(
            "SELECT name FROM sqlite_master WHERE type IN ('table', 'view')")]
        return {name: repr(database.execute(f'SELECT * FROM "{name}"').fetchall()) for name in names}


def files(service):
    """The content of all files of the service but its settings, which hold the names by intent.
    Snapshots are unpacked."""
    found = {}
    for path in service.directory.rglob("*"):
        if not path.is_file() or path == service.config or "preferences" in path.parts:
            continue
        content = path.read_bytes()
        if path.name.endswith(".tar.zst"):
            content = subprocess.run(["tar", "--zstd", "-xOf", path], check=True, capture_output=True).stdout
        found[str(path.relative_to(service.directory))] = content.decode(errors="replace")
    return found


def places(texts, secret):
    return sorted(name for name, text in texts.items() if secret in text)


class DropKeysTest(unittest.TestCase):
    def recorded(self, config):
        """All that a service with that configuration leaves behind."""
        require("tar", "zstd")
        with Service(INTERNAL + config) as service:
            report(service, service.client())
            self.assertEqual(service.stop(), 0, service.log())
            return {**rows(service), **files(service)}

    def test_dropped_keys_are_in_no_file_of_the_service(self):
        without = self.recorded("")
        with_rule = self.recorded(RULE)

        # Without the rule, the same search finds the values.
        for secret in SECRETS:
            with self.subTest(secret):
                self.assertNotEqual(places(without, secret), [])
                self.assertEqual(places(with_rule, secret), [])
        for name in ("analytics_events", "link_messages"):
            self.assertIn(IN_MESSAGE, without[name])
            self.assertIn(KEPT, with_rule[name])
        self.assertTrue(any(name.endswith(".json") and IN_MESSAGE in text for name, text in without.items()))
        self.assertTrue(any(name.endswith(".json") and KEPT in text for name, text in with_rule.items()))

    def test_clients_get_the_same_answers(self):
        with Service(RULE) as service:
            client = service.client()
            client.create(7)
            self.assertIs(client.configure({"home_place": "x"}, 7), True)
            client.start_later(7)
            self.assertIsNone(client.send({"home_town": "x"}, reporters=[7]))
            self.assertEqual(client.valid(7)["reporterID"], 7)
            self.assertIs(client.stop(7), True)
            client.close()

    def test_dropped_keys_do_not_reach_a_nats_server(self):
        require("nats-server")
        if not DRIVER.exists():
            raise unittest.SkipTest("the link to NATS is not in this build")
        for config, is_sent in (("", True), (RULE, False)):
            with self.subTest(config), Server() as server, Service(
                    config + f'[link]\nbackend = "nats"\nservers = ["{server.url}"]\n') as service:
                client = service.client()
                client.create(7)
                client.configure({"HostApplicationDisplayID": IN_CONFIGURATION}, 7)
                client.start_later(7)
                client.send({"home_town": IN_MESSAGE, "kept": KEPT}, reporters=[7])
                client.stop(7)
                wait_for("the message", lambda: any(KEPT in json.dumps(record) for record in
                                                    try_read_stream(server.url)))
                client.close()
                self.assertEqual(service.stop(), 0)

                sent = json.dumps(try_read_stream(server.url))
                self.assertEqual(IN_MESSAGE in sent, is_sent)
                self.assertEqual(IN_CONFIGURATION in sent, is_sent)


if __name__ == "__main__":
    unittest.main()
