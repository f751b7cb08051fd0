"""The output of halvoxctl for a person at the terminal and for a script that follows it."""

import itertools
import json
import os
import plistlib
import re
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

from harness import BIN, CTL, DEADLINE, Follower, Service, wait_for
from tracing import interval

COMPLETION = BIN.parent / "reference/halvoxctl"
SCRIPT = """\
create 7
set-type 7 longformaudio
configure 7 {"HostApplicationDisplayID": "org.example.player"}
start 7
send --id 7 --category Session_Playback --type Start {"latency": 0.042666666666666666, "gain": 1.0}
send --id 7 --category Playback --type Stop {"count": 2}
send --id 7 --category Routing_Error --type 99 {"count": 3}
send --id 7 --category Session_Playback --type IssueDetector {"issue_type": "xrun", "node": "mixer"}
send --id 7 --category Session_Playback --type Joulebook {"EngineOnTime": 4.5}
stop 7
wait 7
"""


def run(*arguments, environment=None, stdin=""):
    return subprocess.run([CTL, *map(str, arguments)], capture_output=True, text=True, check=False,
                          timeout=DEADLINE, input=stdin, env={**os.environ, **(environment or {})})


class WithService(unittest.TestCase):
    """A service on an internal build in which a session has run."""

    def setUp(self):
        self.service = Service("[device]\nInternalBuild = true\n"
                               "[drivers]\nalsa = false\npipewire = false\n")
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)
        self.assertEqual(self.ctl("run", "-", stdin=SCRIPT).stderr, "")
        wait_for("the session's last record", lambda: "Summary" in self.ctl("link").stdout
                 or "65535" in self.ctl("link", "--json").stdout)

    def ctl(self, *arguments, status=0, **more):
        result = run(*arguments, environment={"HALVOX_CONFIG": str(self.service.config)}, **more)
        self.assertEqual(result.returncode, status, result.stderr)
        return result

    def lines(self, *arguments):
        return self.ctl(*arguments).stdout.splitlines()


class JsonFailuresTest(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-terminal-"))
        self.addCleanup(shutil.rmtree, self.directory, ignore_errors=True)
        self.config = self.directory / "halvox.toml"
        self.config.write_text(f'[listener]\nsocket = "{self.directory / "no.sock"}"\n'
                               f'[storage]\ndirectory = "{self.directory / "no-state"}"\n')
        self.script = self.directory / "script"
        self.script.write_text("create 7\n")
        self.params = self.directory / "params.plist"
        points = [interval("tick", 0x21040010, 0x21040014)]
        self.params.write_bytes(plistlib.dumps(
            {"Children": [{"Name": "T", "TraceType": "ktrace", "Children": points}]}))

    def failure(self, status, *arguments, **more):
        """The object that a failing command prints."""
        result = run("--json", *arguments, environment={"HALVOX_CONFIG": str(self.config)}, **more)
        self.assertEqual(result.returncode, status, result.stderr)
        self.assertEqual(len(result.stdout.splitlines()), 1, result.stdout)
        failure = json.loads(result.stdout)
        self.assertEqual(set(failure), {"command", "result", "error"})
        self.assertIs(failure["result"], False)
        self.assertEqual(set(failure["error"]), {"kind", "name", "message"})
        # A person gets the same text.
        self.assertIn(failure["error"]["message"].splitlines()[0], result.stderr)
        return failure["command"], failure["error"]["kind"]

    def test_every_request_without_a_service_prints_an_error_object(self):
        message = ("--category", "1", "--type", "1", "{}")
        for command in (["create", 7], ["set-type", 7, "test"], ["type", 7], ["configure", 7, "{}"],
                        ["start", 7], ["send", "--all", *message], ["stop", 7], ["destroy", 7],
                        ["valid", 7], ["list"], ["kill"]):
            self.assertEqual(self.failure(69, *command), (command[0], "no-service"))
        self.assertEqual(self.failure(69, "run", self.script), ("create", "no-service"))
        self.assertEqual(self.failure(69, "shell", stdin="list\n"), ("list", "no-service"))
        self.assertEqual(self.failure(69, "trace", "record", "--params", self.params, "--", "true"),
                         ("trace record", "no-service"))

    def test_every_command_without_a_store_prints_an_error_object(self):
        for command in ("events", "metrics", "power", "link", "snapshots"):
            self.assertEqual(self.failure(69, command), (command, "no-store"))
            self.assertEqual(self.failure(69, command, "--follow"), (command, "no-store"))
        self.assertEqual(self.failure(69, "summary"), ("summary", "no-store"))
        self.assertEqual(self.failure(69, "snapshots", "show", "newest"),
                         ("snapshots show", "no-store"))

    def test_wrong_arguments_print_an_error_object(self):
        nowhere = self.directory / "nowhere"
        for command, arguments in (("create", ["create", "x"]), ("", ["frobnicate"]), ("", []),
                                   ("events", ["events", "--since", "never"]),
                                   ("run", ["run", nowhere]), ("notify", ["notify", "a/b"]),
                                   ("trace show", ["trace", "show", nowhere]),
                                   ("trace export", ["trace", "export", nowhere, "--to", nowhere]),
                                   ("snapshots show", ["snapshots", "show", nowhere]),
                                   ("summary", ["summary", nowhere]),
                                   ("preferences", ["preferences", "get", "a/b"])):
            self.assertEqual(self.failure(2, *arguments), (command, "bad-arguments"))
        self.assertEqual(self.failure(2, "shell", stdin="create x\n"), ("create", "bad-arguments"))
        self.assertEqual(self.failure(2, "shell", stdin="create 'x\n"), ("", "bad-arguments"))

    def test_a_wrong_configuration_prints_an_error_object(self):
        self.config.write_text("[storage]\ndirectory = 7\n")
        for command in ("list", "events", "summary", "drivers"):
            self.assertEqual(self.failure(78, command), (command, "bad-configuration"))

    def test_what_cannot_be_done_prints_an_error_object(self):
        self.assertEqual(self.failure(1, "preferences", "get", "com.tarno.halvox", "none"),
                         ("preferences", "refused"))


class TimesTest(WithService):
    # In lines and in JSON, in file names and in payloads.
    PRINTED = re.compile(r"\d{4}-\d\d-\d\d[ T]\d\d:\d\d:\d\d(?:\.\d+)?(?:Z| ?[+-]\d\d:?\d\d)?"
                         r"|\d{8}-\d{6}[+-]\d{4}|\b\d{10}\.\d+\b")

    def test_every_time_that_a_command_prints_is_taken_again(self):
        printed = set()
        for command in ("events", "metrics", "power", "link", "snapshots", "summary"):
            for form in ([], ["--json"]):
                printed |= set(self.PRINTED.findall(self.ctl(command, *form).stdout))
        # The forms of the lines, of JSON, of summaries and of their file names.
        for form in (r"\d{4}-.*\.\d{3}$", r"\d{10}\.", r".*:\d\d \+", r"\d{8}-"):
            self.assertTrue([time for time in printed if re.match(form, time)], (form, printed))

        for time in printed:
            for option in ("--since", "--until"):
                for command in ("events", "link"):
                    self.ctl(command, option, time)

    def test_an_event_is_shown_since_its_own_printed_time(self):
        for line in self.lines("events"):
            self.assertIn(line, self.lines("events", "--since", line[:23]))

    def test_times_that_people_type_are_taken(self):
        everything = self.lines("events")
        for since in ("today", "yesterday", "-5m", "5min", "-5min", "300s", "1h", "1d", "1w",
                      "2020-11-21 22:44", "2020-11-21T22:44:05+01:00", "@1600000000"):
            # A test that runs across midnight may lose its earlier records from "today".
            if since != "today":
                self.assertEqual(self.lines("events", "--since", since), everything, since)
            self.ctl("events", "--since=" + since)
        self.assertEqual(self.lines("events", "--until", "2020-11-21 22:44"), [])

    def test_anything_else_is_answered_with_examples(self):
        error = self.ctl("events", "--since", "tea", status=2).stderr
        self.assertIn('"tea" is not a time; expected one such as "2026-11-21 22:44"', error)


class FollowTest(WithService):
    def test_following_from_the_last_0_shows_only_what_comes(self):
        client = self.service.client()
        self.addCleanup(client.close)
        client.create(9)
        client.set_type(7, 9)
        client.start_later(9)
        for command in ("events", "link"):
            follower = Follower(self.service, [command, "--last", "0"])
            self.addCleanup(follower.close)
            numbers = itertools.count()

            def shown():
                # Until the follower has begun, stored records count as old for it.
                client.send({"news": next(numbers)}, reporters=[9])
                return follower.so_far()
            records = wait_for("a record", shown, pause=0.1)

            # The records of the script are older and are not shown.
            self.assertTrue(all("news" in record["payload"] for record in records), records)


class NamesTest(WithService):
    def shown(self, *arguments):
        """Category and type of the link messages that are shown."""
        return [line.split("  ")[3] for line in self.lines("link", *arguments)]

    def test_link_messages_are_shown_with_the_names_of_domain_category_and_type(self):
        self.assertEqual(self.shown()[:5],
                         ["Session_Playback/Start", "Playback/Stop", "Routing_Error/99",
                          "Session_Playback/IssueDetector", "Session_Playback/Joulebook"])
        record = json.loads(self.lines("link", "--json")[0])
        self.assertEqual((record["category"], record["category_name"]), (4, "Session_Playback"))
        self.assertEqual((record["type"], record["type_name"]), (1, "Start"))

    def test_link_messages_are_chosen_by_names_and_numbers(self):
        session = [name for name in self.shown() if name.startswith("Session_Playback/")]
        self.assertEqual(self.shown("--category", "Session_Playback"), session)
        self.assertEqual(self.shown("--category", "0x08000004"), session)
        self.assertEqual(self.shown("--category", "session_playback", "--last", "1"), session[-1:])
        self.assertEqual(self.shown("--category", "Playback"), session[:1] + ["Playback/Stop"] + session[1:])
        self.assertEqual(self.shown("--category", "MIDI_Playback"), [])
        self.assertEqual(self.shown("--type", "Start"), ["Session_Playback/Start"])
        self.assertEqual(self.shown("--type", "8"), ["Session_Playback/Joulebook"])

    def test_what_is_shown_is_taken(self):
        for name in set(self.shown()):
            category, event_type = name.split("/")
            self.assertIn(name, self.shown("--category", category, "--type", event_type))

    def completed(self, *words):
        script = ('source "$1"; shift; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _halvoxctl; '
                  'printf "%s\\n" "${COMPREPLY[@]}"')
        result = subprocess.run(["bash", "-c", script, "bash", str(COMPLETION), "halvoxctl", *words, ""],
                                capture_output=True, text=True, check=True, timeout=DEADLINE)
        return result.stdout.split()

    def test_the_command_takes_what_the_completion_offers(self):
        for option in ("--category", "--type", "--service"):
            offered = self.completed("link", option)
            self.assertGreater(len(offered), 10, option)
            # The options are given together: any of their values may match.
            self.ctl("link", *(word for name in offered for word in (option, name)))
        self.assertIn("longformaudio_session", self.completed("link", "--service"))
        self.assertEqual(self.completed("power", "--category"), [])
        for name in self.completed("notify"):
            if not name.startswith("-"):
                self.ctl("notify", name)


class NothingDoneTest(WithService):
    def test_an_unknown_notification_is_refused_with_the_known_ones(self):
        error = self.ctl("notify", "bogus", status=2).stderr
        self.assertIn("nothing was posted", error)
        names = re.findall(r"com\.tarno\.[\w.-]+\w", error)
        self.assertEqual(len(names), 2)
        self.assertFalse((self.service.directory / "state/notify/bogus").exists())

    def test_the_service_receives_every_notification_that_is_offered(self):
        self.service.stop()
        self.service.config.write_text(self.service.config.read_text() + '[log]\nlevel = "debug"\n')
        self.service.start()
        names = re.findall(r"com\.tarno\.[\w.-]+\w", self.ctl("notify", "bogus", status=2).stderr)
        for name in names:
            heard = self.service.log().count("defaults (null)")
            self.ctl("notify", name)
            wait_for(f"{name} to be heard",
                     lambda: self.service.log().count("defaults (null)") > heard)

    def test_an_unknown_group_is_refused_with_the_existing_ones(self):
        drivers = self.service.directory / "state/drivers"
        drivers.mkdir()
        (drivers / "a.prom").write_text('# TYPE a counter\na_total{group="Rx"} 3\n')
        for more in ([], ["--watch"]):
            result = self.ctl("drivers", "--group", "Nope", *more, status=1)
            self.assertEqual(result.stderr, 'halvoxctl drivers: nothing to show: there is no group '
                                            '"Nope"; the only group is Rx\n')
            self.assertEqual(result.stdout, "")


class WordsTest(WithService):
    def test_numbers_are_as_short_as_they_read_back(self):
        for command in ("events", "link"):
            text = self.ctl(command).stdout
            self.assertIn(" latency=0.042666666666666665 gain=1 ", text)
            self.assertNotIn("0.042666666666666668", text)

    def test_mistakes_in_json_are_reported_with_their_place(self):
        self.assertEqual(
            self.ctl("configure", "7", '{"a":}', status=2).stderr.splitlines()[0],
            'halvoxctl configure: JSON: line 1, column 6: expected a value, found "}"')
        summary = self.service.directory / "broken.json"
        summary.write_text('[\n {"a" 1}]')
        self.assertIn('line 2, column 7: expected ":" after the name, found "1"',
                      self.ctl("summary", summary, status=2).stderr)

    def test_the_help_of_the_shell_has_the_form_of_its_lines(self):
        text = self.ctl("shell", stdin="help\n").stdout
        self.assertIn("Usage: COMMAND", text)
        self.assertNotIn("[OPTIONS] COMMAND", text)


if __name__ == "__main__":
    unittest.main()
