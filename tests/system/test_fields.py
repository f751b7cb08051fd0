"""The keys of stored records."""

import json
import unittest

from harness import start_service, wait_for
from terminal import lines_at_terminal

VOLUME, STATE = 14, 18
SESSION_PLAYBACK, JOULEBOOK = 0x08000004, 8
HAPTICS, LONG_FORM = 3, 7


class FieldsTest(unittest.TestCase):
    def setUp(self):
        self.service, self.client = start_service(self)
        for session, service_type in ((7, LONG_FORM), (8, HAPTICS)):
            self.client.begin(session, service_type, f"org.app{session}")
        self.client.send({"gain": 0.5, "list": [1, 2]}, VOLUME, STATE, [7])
        self.client.send({"gain": "high"}, SESSION_PLAYBACK, 1, [8])
        self.client.send({"EngineOnTime": 4.5}, SESSION_PLAYBACK, JOULEBOOK, [8])
        wait_for("the messages", lambda: self.service.database.exists()
                 and len(self.service.link_messages(8)) == 2 and len(self.service.link_messages(7)) == 1)
        wait_for("the events", lambda: len(self.service.events()) == 6)
        wait_for("the power event", lambda: "EngineOnDuration" in self.fields())

    def ctl(self, *arguments, **options):
        return self.service.ctl(*arguments, **options)

    def fields(self, *arguments):
        lines = self.ctl("fields", "--json", *arguments).stdout.splitlines()
        return {field["key"]: field for field in map(json.loads, lines)}

    def test_every_key_is_listed_with_types_counts_and_places(self):
        fields = self.fields()

        gain = fields["gain"]
        self.assertEqual(gain["types"], {"number": 2, "text": 2})
        self.assertEqual((gain["events"], gain["link_messages"], gain["records"]), (2, 2, 4))
        self.assertEqual({place["name"]: place["count"] for place in gain["in"]},
                         {"Volume.State": 2, "Session_Playback.Start": 2})
        self.assertEqual(fields["list"]["example"], [1, 2])
        self.assertEqual(fields["EngineOnDuration"]["power_events"], 1)
        self.assertEqual(fields["EngineOnDuration"]["in"], [{"name": "Oxbow_Haptics", "count": 1}])
        self.assertEqual(fields["audiotag"]["events"], 0)
        self.assertEqual(fields["hvreporting_timestamp"]["events"], 3)
        self.assertEqual(list(fields), sorted(fields))

    def test_filters_select(self):
        self.assertNotIn("list", self.fields("--category", "Session_Playback"))
        self.assertIn("list", self.fields("--type", "State"))
        self.assertEqual(self.fields("--app", "org.app8")["gain"]["example"], "high")
        self.assertNotIn("audiotag", self.fields("--app", "*"))
        self.assertEqual(self.fields("--until", "1h"), {})

    def test_a_table_fits_the_terminal(self):
        self.assertIn("Session_Playback.Start", self.ctl("fields").stdout)
        for width in (40, 80, 120):
            lines = lines_at_terminal(self.service, "fields", columns=width)
            self.assertEqual(len(lines), len(self.fields()) + 1)
            for line in lines:
                self.assertLessEqual(len(line), width, line)


if __name__ == "__main__":
    unittest.main()
