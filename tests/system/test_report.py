"""The page that `halvoxctl report` writes, opened in a browser: what it shows is what was recorded."""

import contextlib
import json
import os
import re
import signal
import subprocess
import tempfile
import unittest
from pathlib import Path

import audio
import browser
from harness import CTL, Service, stop_process, wait_for
from player import begin_stream

XRUNS = """SELECT count(*) AS n, coalesce(sum(payload ->> 'missed_cycles'), 0) AS cycles
    FROM analytics_events WHERE name GLOB 'com.tarno.halvox.*.IssueDetector'
    AND payload ->> 'issue_type' = 'xrun'"""
REPOSITORY = Path(__file__).resolve().parents[2]
VOLUME, PLAYBACK = 14, 0x08000004
STOP, ISSUE, STATE = 2, 7, 18
# A name may contain anything that is UTF-8.
HOSTILE = ["</script><script>document.title = 'taken'</script>", "<img src=x onerror=alert(1)>",
           "evil\u202egnp.exe", "zero\u200bwidth", "&lt;b&gt;\"'`", "<!-- ", "]]>", "x" * 10_000]


def artefacts():
    """Where pictures of the page are kept after the test."""
    directory = Path(os.environ.get("HALVOX_BIN", "build/dev/bin")).resolve().parent / "report-screenshots"
    directory.mkdir(exist_ok=True)
    return directory


def why_skip():
    if browser.missing() and not os.environ.get("CI"):
        return browser.missing()
    # In CI a missing browser is a fault of the set-up, not a reason to pass.
    refused = 1
    result = subprocess.run([CTL, "report", "-o", "-", "--database", "/nonexistent"],
                            capture_output=True, text=True, check=False)
    return result.stderr.strip() if result.returncode == refused else ""


def send_stream(client, session, application, xruns=(), device="Speakers"):
    """What a player reports that plays, changes its volume, has xruns and stops."""
    send = begin_stream(client, session, application, device)
    send({"RQSessionVolume": 0.8, "RQSessionVolumePlayingState": 1}, VOLUME, STATE)
    for number, milliseconds in enumerate(xruns):
        send({"issue_type": "xrun", "node": application, "rtaid_client": application, "number": number,
              "any_channel_silence_seconds": milliseconds / 1000, "xrun_milliseconds": milliseconds,
              "missed_cycles": 2, "quantum": 1024, "rate": 48000, "xrun_role": "culprit"},
             PLAYBACK, ISSUE)
    send({"RQSessionVolume": 0.8, "RQSessionVolumePlayingState": 0}, VOLUME, STATE)
    send({"run": 1}, PLAYBACK, STOP)
    client.stop(session)


class ReportTestCase(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        if why_skip():
            raise unittest.SkipTest(why_skip())
        cls.stack = contextlib.ExitStack()
        cls.addClassCleanup(cls.stack.close)
        cls.browser = cls.stack.enter_context(browser.Browser())
        cls.directory = Path(cls.stack.enter_context(tempfile.TemporaryDirectory()))

    @classmethod
    def ctl(cls, *arguments):
        return cls.service.ctl(*arguments).stdout

    @classmethod
    def rows(cls, *arguments):
        return [json.loads(line) for line in cls.ctl(*arguments, "--json").splitlines()]

    @classmethod
    def write_report(cls, *arguments, name="report.html"):
        path = cls.directory / name
        cls.ctl("report", "-o", str(path), *arguments)
        return path

    def show(self, path, **options):
        self.browser.open(path, **options)
        self.browser.frames()
        return self.browser.evaluate("JSON.parse(document.getElementById('data').textContent)")

    def texts(self, selector):
        return self.browser.evaluate(
            f"[...document.querySelectorAll({json.dumps(selector)})].map(one => one.textContent)")


class ReportTest(ReportTestCase):
    """A store with known streams and hostile names."""

    XRUNS = {"org.example.player": (500, 20, 80), "org.example.browser": (40,)}

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.service = cls.stack.enter_context(Service())
        client = cls.service.client()
        cls.stack.callback(client.close)
        for session, (application, xruns) in enumerate(cls.XRUNS.items(), 100):
            send_stream(client, session, application, xruns)
        for session, name in enumerate(HOSTILE, 200):
            send_stream(client, session, name, (10,), device=name)
        streams = len(cls.XRUNS) + len(HOSTILE)
        wait_for("the last message", lambda: cls.rows(
            "sql", "SELECT count(*) AS n FROM analytics_events"
                   " WHERE name = 'com.tarno.halvox.Session_Playback.Stop'")[0]["n"] == streams)
        cls.path = cls.write_report()

    def test_every_recorded_xrun_has_one_mark(self):
        [recorded] = self.rows("sql", XRUNS)
        data = self.show(self.path)

        expected = sum(map(len, self.XRUNS.values())) + len(HOSTILE)
        self.assertEqual(recorded["n"], expected)
        marks = self.browser.evaluate("[...document.querySelectorAll('.timeline a[data-xrun]')]"
                                      ".map(mark => Number(mark.dataset.xrun))")
        self.assertEqual(sorted(marks), list(range(expected)))
        self.assertEqual(data["totals"]["xruns"], expected)
        self.assertEqual(self.browser.problems(), [])

    def test_the_totals_are_those_of_sql(self):
        data = self.show(self.path)
        totals = data["totals"]
        count = {table: self.rows("sql", f"SELECT count(*) AS n FROM {table}")[0]["n"] for table in (
            "analytics_events", "link_messages", "issue_metrics", "power_events", "snapshots")}
        [xruns] = self.rows("sql", XRUNS)

        self.assertEqual(totals["events"], count["analytics_events"])
        self.assertEqual(totals["links"], count["link_messages"])
        self.assertEqual(totals["metrics"], count["issue_metrics"])
        self.assertEqual(totals["power"], count["power_events"])
        self.assertEqual(totals["snapshots"], count["snapshots"])
        self.assertEqual(totals["missedCycles"], xruns["cycles"])
        self.assertEqual(sum(row["xruns"] for row in data["byApplication"]), totals["xruns"])
        self.assertEqual(sum(stream["xruns"] for stream in data["streams"]), totals["xruns"])
        self.assertEqual(sum(row["count"] for row in data["names"]["series"]), totals["events"])
        by_name = self.rows("sql", "SELECT name, count(*) AS n FROM analytics_events GROUP BY name")
        self.assertEqual({row["name"]: row["count"] for row in data["names"]["series"]},
                         {row["name"]: row["n"] for row in by_name})

    def test_the_totals_are_those_of_streams(self):
        data = self.show(self.path)
        streams = {row["id"]: row for row in self.rows("streams")}

        self.assertEqual(data["totals"]["streams"], len(streams))
        self.assertEqual({stream["id"]: (stream["xruns"], stream["xrunMs"]) for stream in data["streams"]},
                         {key: (row["xruns"]["reports"], row["xruns"]["milliseconds"])
                          for key, row in streams.items()})
        self.assertEqual(data["totals"]["missedCycles"],
                         sum(row["xruns"]["missed_cycles"] for row in streams.values()))
        for stream in data["streams"]:
            self.assertAlmostEqual(stream["ran"], streams[stream["id"]]["ran_seconds"], places=2)

    def test_the_worst_xrun_comes_first_and_leads_to_its_messages(self):
        self.show(self.path)
        first = self.texts("#worst tbody tr:first-child > *")
        self.assertIn("500 ms", first)
        self.assertIn("org.example.player", first)

        self.browser.evaluate("document.querySelector('#worst tbody a').click()")
        self.browser.frames()

        rows = self.texts("#around tbody tr")
        self.assertTrue(any("issue_type=xrun" in row and "xrun_milliseconds=500" in row for row in rows))
        self.assertTrue(any("RQSessionVolume=0.8" in row for row in rows))
        self.assertEqual(len(self.texts(".timeline a.chosen")), 1)

    def test_the_copyright_of_the_packages_names_its_libraries(self):
        listed = (REPOSITORY / "debian" / "copyright").read_text(encoding="utf-8")
        names = set(re.split(r"[\s,]+", listed.replace(". ", " ")))
        notices = re.findall(r"^(\S+ \d+\.\d+\.\d+(?:, \S+ \d+\.\d+\.\d+)*):$",
                             self.path.read_text(encoding="utf-8"), re.MULTILINE)
        libraries = [one.split()[0] for notice in notices for one in notice.split(", ")]
        self.assertIn("d3-scale", libraries)
        self.assertEqual([one for one in libraries if one not in names], [])

    def test_hostile_names_are_text(self):
        data = self.show(self.path)
        page = self.path.read_text(encoding="utf-8")

        self.assertEqual(page.lower().count("</script"), 2)
        self.assertTrue(self.browser.evaluate("document.title").startswith("Halvox report"))
        self.assertEqual(self.browser.evaluate("document.querySelectorAll('img, #page b').length"), 0)
        self.assertEqual(self.browser.problems(), [])
        names = {stream["app"] for stream in data["streams"]}
        self.assertLessEqual(set(HOSTILE[:-1]), names)
        self.browser.evaluate("document.querySelectorAll('details').forEach(one => { one.open = true })")
        self.browser.frames()
        shown = self.browser.evaluate("document.body.innerText")
        self.assertIn("</script><script>document.title = 'taken'</script>", shown)
        self.assertIn("evil[U+202E]gnp.exe", shown)
        self.assertNotIn("\u202e", shown)
        self.assertNotIn("x" * 600, shown)

    def test_the_keyboard_goes_from_mark_to_mark(self):
        self.show(self.path)
        in_order = self.browser.evaluate(
            "JSON.parse(document.getElementById('data').textContent).xruns.map(xrun => xrun.t)")
        focusable = ".timeline a[tabindex='0']"
        self.assertEqual(len(self.texts(focusable)), 1)
        self.browser.evaluate(f'document.querySelector("{focusable}").focus()')
        focused = "Number(document.activeElement.dataset.xrun)"

        first = self.browser.evaluate(focused)
        self.assertEqual(in_order[first], min(in_order))
        tip = "document.querySelector('.tip').hidden"
        self.assertFalse(self.browser.evaluate(tip))
        self.browser.press("ArrowRight")
        self.assertNotEqual(self.browser.evaluate(focused), first)
        self.browser.press("ArrowLeft")
        self.assertEqual(self.browser.evaluate(focused), first)
        self.browser.press("Enter")
        self.assertTrue(self.browser.evaluate("document.activeElement.id === 'around'"))
        self.assertTrue(self.texts("#around tbody tr"))

    def test_a_screen_reader_meets_named_marks_and_tables(self):
        self.show(self.path)
        nodes = self.browser.accessibility_tree()

        def names(role):
            return [node.get("name", {}).get("value", "") for node in nodes
                    if node.get("role", {}).get("value") == role]
        marks = [name for name in names("link") if " lost " in name]
        self.assertEqual(len(marks), sum(map(len, self.XRUNS.values())) + len(HOSTILE))
        self.assertTrue(any("org.example.player lost 500 ms" in name and "on Speakers" in name
                            for name in marks))
        self.assertTrue(all(names("table")), names("table"))
        self.assertTrue(all(names("image")), names("image"))
        self.assertTrue(all(names("region")), names("region"))

    def test_zooming_narrows_what_is_shown(self):
        self.show(self.path)
        shown = "document.querySelector('.timeline-shown').textContent"
        before = self.browser.evaluate(shown)
        for label in ("Zoom in", "Zoom in", "Later"):
            self.browser.evaluate("[...document.querySelectorAll('button')]"
                                  f".find(one => one.textContent === '{label}').click()")
        self.browser.frames()
        self.assertNotEqual(self.browser.evaluate(shown), before)
        self.browser.evaluate("[...document.querySelectorAll('button')]"
                              ".find(one => one.textContent === 'Show all').click()")
        self.browser.frames()
        self.assertEqual(self.browser.evaluate(shown), before)

    def test_pictures_in_light_and_dark_wide_and_narrow(self):
        for width in (1280, 400):
            for scheme in ("light", "dark"):
                with self.subTest(width=width, scheme=scheme):
                    self.show(self.path, width=width, scheme=scheme)
                    self.assertLessEqual(
                        self.browser.evaluate("document.documentElement.scrollWidth"), width)
                    background = self.browser.evaluate(
                        "getComputedStyle(document.body).backgroundColor")
                    self.assertEqual(background == "rgb(255, 255, 255)", scheme == "light")
                    self.assertEqual(self.browser.problems(), [])
                    self.browser.screenshot(artefacts() / f"report-{width}-{scheme}.png")

    def test_a_period_without_records_says_so(self):
        data = self.show(self.write_report("--until", "@1000", name="empty.html"))
        self.assertIsNone(data["period"])
        self.assertEqual(data["totals"]["events"], 0)
        self.assertIn("no records of this period", self.browser.evaluate("document.body.innerText"))
        self.assertEqual(self.browser.problems(), [])


class ComparisonTest(ReportTestCase):
    """A quiet day and a day with xruns, in two stores."""

    QUIET, BUSY = (10,), (30, 20, 40, 10, 25, 35)
    STREAMS = 4

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.stores = []
        for name, xruns in (("before", cls.QUIET), ("after", cls.BUSY)):
            directory = cls.directory / name
            directory.mkdir()
            with Service(directory=directory) as cls.service:
                client = cls.service.client()
                for session in range(1, cls.STREAMS + 1):
                    send_stream(client, session, "org.example.player", xruns)
                send_stream(client, 100, HOSTILE[0], xruns, device=HOSTILE[2])
                client.close()
            # The end of the service has stored everything.
            cls.stores.append(directory / "state" / "halvox.db")

    def changes(self):
        first, *rows = self.rows("report", "--compare", *map(str, self.stores))
        return first, rows

    def test_the_figures_are_those_of_the_streams(self):
        first, rows = self.changes()

        self.assertEqual(first["before"]["xruns"], (self.STREAMS + 1) * len(self.QUIET))
        self.assertEqual(first["after"]["xruns"], (self.STREAMS + 1) * len(self.BUSY))
        for side, store in zip(("before", "after"), self.stores):
            streams = self.rows("streams", "--database", str(store))
            hours = sum(row["ran_seconds"] for row in streams) / 3600
            xruns = sum(row["xruns"]["reports"] for row in streams)
            [row] = [row for row in rows if (row["what"], row["of"]) == ("xruns", "all streams")]
            self.assertAlmostEqual(row[side] * hours, xruns, places=3)

    def test_the_page_shows_each_figure(self):
        first, rows = self.changes()
        path = self.write_report("--compare", *map(str, self.stores), name="comparison.html")
        for width in (1280, 400):
            for scheme in ("light", "dark"):
                with self.subTest(width=width, scheme=scheme):
                    data = self.show(path, width=width, scheme=scheme)
                    self.assertEqual(len(data["changes"]), len(rows))
                    self.assertLessEqual(
                        self.browser.evaluate("document.documentElement.scrollWidth"), width)
                    self.assertEqual(self.browser.problems(), [])
                    self.browser.screenshot(artefacts() / f"comparison-{width}-{scheme}.png")
        self.assertEqual(len(self.texts("#changes tbody tr")), min(len(rows), 200))
        shown = self.browser.evaluate("document.body.innerText")
        self.assertIn("</script><script>document.title = 'taken'</script>", shown)
        self.assertNotIn("\u202e", shown)


@unittest.skipIf(audio.missing(), audio.missing())
class RealFreezeTest(ReportTestCase):
    """A real player that is frozen for half a second."""

    def test_the_half_second_is_the_first_thing_on_the_page(self):
        cls = type(self)
        cls.service = self.stack.enter_context(Service())
        sound = self.stack.enter_context(audio.Audio())
        reporter = self.stack.enter_context(audio.Reporter(sound, cls.service))
        player = sound.play(60, volume=0.8)
        self.stack.callback(stop_process, player)
        wait_for("the player's volume", lambda: any(
            name.endswith("Volume.State") for name, _ in cls.service.events()))
        player.send_signal(signal.SIGSTOP)
        self.wait_for_frozen_cycles()
        player.send_signal(signal.SIGCONT)
        stop_process(player)
        stop_process(reporter.process)
        wait_for("the end of the reporter", lambda: any(
            name.endswith("hvreportingclientuptime") for name, _ in cls.service.all_events()))

        [recorded] = self.rows("sql", XRUNS)
        data = self.show(self.write_report())

        self.assertEqual(data["totals"]["xruns"], recorded["n"])
        self.assertEqual(len(self.texts(".timeline a[data-xrun]")), recorded["n"])
        self.assertGreaterEqual(data["totals"]["xrunMs"], 400)
        first = self.texts("#worst tbody tr:first-child > *")
        self.assertIn("pw-play", first)
        self.assertIn("pw-play", self.texts(".verdict")[0])
        self.browser.screenshot(artefacts() / "report-freeze.png")

    def wait_for_frozen_cycles(self):
        def seconds():
            return sum(payload["any_channel_silence_seconds"] for name, payload in self.service.events()
                       if name == "com.tarno.halvox.Session_Playback.IssueDetector")
        wait_for("half a second of silence", lambda: seconds() >= 0.4)


if __name__ == "__main__":
    unittest.main()
