"""What bash, zsh and fish offer for a command line of halvoxctl."""

import json
import os
import pty
import select
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

import harness
from harness import BIN, CTL, DEADLINE, Service, wait_for

REFERENCE = BIN.parent / "reference"
BASH = """\
source "$1"; shift
COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1))
_halvoxctl
((${#COMPREPLY[@]} == 0)) || printf '%s\\n' "${COMPREPLY[@]}"
"""
# Writes what is added to the list of matches into a file, and a line into a pipe at the end.
ZSH = """\
PROMPT= RPROMPT=
unsetopt zle_bracketed_paste beep
fpath=({reference} $fpath)
autoload -Uz compinit
compinit -u -D
compadd() {{
  if [[ ${{argv[1,(i)(-|--)]}} == *-[OAD]* ]]; then
    builtin compadd "$@"
    return
  fi
  local -a matching
  builtin compadd -A matching "$@"
  (($#matching)) && print -rl -- $matching >>$MATCHES
  builtin compadd "$@"
}}
tell() {{ print done >$DONE; }}
complete-and-tell() {{ comppostfuncs=(tell); zle complete-word; }}
zle -C list-all complete-word _main_complete
finish() {{ zle list-all; print done >$DONE; zle kill-whole-line; }}
zle -N finish
bindkey '^X' finish
print ready >$DONE
"""


class Shells(unittest.TestCase):
    """Asks each shell what it offers. The last word is the one at the cursor."""

    def setUp(self):
        for shell in ("bash", "zsh", "fish"):
            harness.require(shell)
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-completion-"))
        self.addCleanup(shutil.rmtree, self.directory, ignore_errors=True)
        (self.directory / "notes.txt").touch()
        (self.directory / "folder").mkdir()
        self.environment = {**os.environ, "PATH": f"{Path(CTL).parent}:{os.environ['PATH']}",
                            "HOME": str(self.directory), "ZDOTDIR": str(self.directory), "TERM": "xterm",
                            "XDG_CONFIG_HOME": str(self.directory / ".config"),
                            "XDG_DATA_HOME": str(self.directory / ".local"),
                            "HALVOX_CONFIG": str(self.configuration())}

    def configuration(self):
        config = self.directory / ".halvox.toml"
        config.write_text(f'[listener]\nsocket = "{self.directory}/.none.sock"\n'
                          f'[storage]\ndirectory = "{self.directory}/.none"\n')
        return config

    def run_shell(self, *arguments):
        return subprocess.run(arguments, capture_output=True, text=True, check=True, timeout=DEADLINE,
                              cwd=self.directory, env=self.environment).stdout

    def bash(self, *words):
        return self.run_shell("bash", "-c", BASH, "bash", REFERENCE / "halvoxctl", "halvoxctl",
                              *words).splitlines()

    def fish(self, *words):
        script = f"source {REFERENCE}/halvoxctl.fish; complete -C $argv[1]"
        lines = self.run_shell("fish", "--no-config", "-c", script, " ".join(("halvoxctl", *words)))
        return [line.split("\t")[0] for line in lines.splitlines()]

    def zsh(self, *words):
        matches, done, start = (self.directory / name for name in (".matches", ".done", ".zshrc"))
        matches.write_text("")
        start.write_text(ZSH.format(reference=REFERENCE))
        os.mkfifo(done)
        # The shell's end must not be the last one, or reading would end with each line.
        pipe = os.open(done, os.O_RDWR)
        child, terminal = pty.fork()
        if child == 0:
            os.chdir(self.directory)
            os.execvpe("zsh", ["zsh", "-i"], {**self.environment, "MATCHES": str(matches), "DONE": str(done)})
        try:
            self.wait_for_line(pipe, terminal)
            os.write(terminal, (" ".join(("halvoxctl", *words)) + "\x18").encode())
            self.wait_for_line(pipe, terminal)
        finally:
            os.close(terminal)  # hangs up
            os.waitpid(child, 0)
            os.close(pipe)
            done.unlink()
        return matches.read_text().splitlines()

    def wait_for_line(self, pipe, terminal):
        """Waits for a line from the pipe, and empties the terminal meanwhile."""
        while True:
            ready, _, _ = select.select([pipe, terminal], [], [], DEADLINE)
            self.assertTrue(ready, "zsh is silent")
            if pipe in ready:
                os.read(pipe, 100)
                return
            os.read(terminal, 65536)

    def offered(self, *words):
        """For each shell what it offers, without the slashes and blanks that follow a match."""
        return {shell.__name__: {match.rstrip("/ ") for match in shell(*words)}
                for shell in (self.bash, self.zsh, self.fish)}

    def check_offers(self, expected, *words):
        for shell, offered in self.offered(*words).items():
            with self.subTest(shell=shell, words=words):
                self.assertLessEqual(set(expected), offered)

    def check_offers_only(self, expected, *words):
        for shell, offered in self.offered(*words).items():
            with self.subTest(shell=shell, words=words):
                self.assertEqual(offered, set(expected))


class CommandsTest(Shells):
    def test_the_commands_of_the_help_are_offered(self):
        text = subprocess.run([CTL, "nonesuch"], capture_output=True, text=True, check=False).stderr
        commands = text.splitlines()[0].split("; expected ")[1].split(", ")
        self.assertGreater(len(commands), 25)
        self.check_offers(commands, "")

    def test_sub_commands_are_offered_after_options_with_values(self):
        self.check_offers(["record", "show", "export"], "trace", "")
        self.check_offers(["show", "extract"], "--socket", "/list", "snapshots", "")

    def test_options_are_those_of_the_command(self):
        self.check_offers_only(["--keep-going"], "run", "--k")
        self.check_offers_only(["--force", "--format"], "export", "--fo")
        self.check_offers_only(["--to"], "snapshots", "extract", "--t")
        self.check_offers_only([], "list", "--database")


class ValuesTest(Shells):
    def test_words_are_offered_for_options_and_arguments(self):
        self.check_offers_only(["xruns", "app", "device", "volume", "started"], "top", "--sort", "")
        self.check_offers_only(["Session_Playback", "Session_PlaybackAndRecord"],
                               "events", "--category", "Session_Pl")
        self.check_offers_only(["telephony", "test"], "set-type", "7", "te")
        self.check_offers_only(["unset"], "preferences", "u")
        self.check_offers_only(["device_name", "disable_reporting"],
                               "preferences", "set", "com.tarno.halvox", "d")

    def test_the_second_value_of_a_pair_is_offered(self):
        for shell in (self.bash, self.zsh):
            self.assertIn("yesterday", shell("report", "--compare", "today", "y"), shell.__name__)

    def test_files_and_directories_are_offered_where_one_is_expected(self):
        self.check_offers_only(["notes.txt"], "run", "n")
        self.check_offers_only(["notes.txt"], "trace", "record", "--params", "n")
        self.check_offers(["folder"], "notify", "--directory", "")
        self.check_offers_only([], "notify", "--directory", "n")
        self.check_offers_only(["notes.txt", "newest"], "snapshots", "show", "n")

    def test_numbers_and_texts_have_no_offers(self):
        self.check_offers_only([], "events", "--last", "")
        self.check_offers_only([], "power", "--category", "")

    def test_programs_are_offered_after_two_dashes(self):
        self.check_offers(["mktemp"], "trace", "record", "--params", "notes.txt", "--", "mktem")


class LiveNamesTest(Shells):
    def configuration(self):
        self.service = Service("[drivers]\nalsa = false\npipewire = false\n")
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)
        return self.service.config

    def setUp(self):
        super().setUp()
        self.client = self.service.client()
        self.addCleanup(self.client.close)
        self.client.create(4711)

    def test_sessions_of_the_service_are_offered(self):
        self.check_offers_only(["4711"], "stop", "47")
        self.check_offers_only(["4711"], "send", "--id", "47")

    def test_the_service_is_the_one_that_the_command_line_names(self):
        self.check_offers_only([], "--socket", "/none.sock", "stop", "47")

    def test_names_in_the_store_are_offered_and_nothing_in_them_is_run(self):
        name = "org.x $(touch pwned)"
        script = "\n".join((
            "create 9", "set-type 9 longformaudio",
            "configure 9 " + json.dumps({"HostApplicationDisplayID": name}), "start 9",
            'send --id 9 --category Session_Playback --type Start {"n": 1}', "stop 9", ""))
        subprocess.run([CTL, "run", "-"], input=script, text=True, check=True, timeout=DEADLINE,
                       capture_output=True, env=self.environment)
        wait_for("the event", lambda: name in subprocess.run(
            [CTL, "events", "--json"], capture_output=True, text=True, check=True, timeout=DEADLINE,
            env=self.environment).stdout)

        self.check_offers(["com.tarno.halvox.Session_Playback.Start"], "events", "--name", "com.tarno.")
        quoted = "org.x\\ \\$\\(touch\\ pwned\\)"
        self.assertEqual(self.bash("events", "--app", "org.x"), [quoted])
        self.assertEqual(self.zsh("events", "--app", "org.x"), [quoted])
        self.assertEqual(self.fish("events", "--app", "org.x"), [name])
        self.assertFalse((self.directory / "pwned").exists())


if __name__ == "__main__":
    unittest.main()
