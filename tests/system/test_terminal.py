"""What a person at the terminal, or a script that reads along, sees of halvoxctl."""

import json
import os
import re
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

from harness import CTL, DEADLINE, Follower, Service, wait_for

COMPLETION = Path(__file__).resolve().parents[2] / "packaging/completions/halvoxctl"
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
    """A service on an internal build, in which a session has lived."""

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
        self.params.write_text("")

    def failure(self, status, *arguments, **more):
        """The object that a failing command prints."""
        result = run("--json", *arguments, environment={"HALVOX_CONFIG": str(self.config)}, **more)
        self.assertEqual(result.returncode, status, result.stderr)
        self.assertEqual(len(result.stdout.splitlines()), 1, result.stdout)
        failure = json.loads(result.stdout)
        self.assertEqual(set(failure), {"command", "result", "error"})
        self.assertIs(failure["result"], False)
        self.assertEqual(set(failure["error"]), {"kind", "name", "message"})
        # The same is said to a person.
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


if __name__ == "__main__":
    unittest.main()
