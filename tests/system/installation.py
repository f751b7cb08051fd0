"""Installs the build into a scratch directory, for tests of what programs outside the tree find."""

import os
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

import harness
from harness import BIN

BUILD = BIN.parent


def run(*command, **options):
    """Runs a program to its end and returns what it printed."""
    result = subprocess.run([str(part) for part in command], stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                            text=True, timeout=harness.DEADLINE, check=False, **options)
    if result.returncode != 0:
        raise AssertionError(f"{command} ended with {result.returncode}:\n{result.stdout}")
    return result.stdout


class Installation(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        for tool in "cmake", "cc", "pkg-config":
            harness.require(tool)
        cls.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        cls.addClassCleanup(shutil.rmtree, cls.directory, True)
        cls.prefix = cls.directory / "usr"
        run("cmake", "--install", BUILD, "--prefix", cls.prefix)
        cls.libraries, = {path.parent for path in cls.prefix.glob("lib/**/libhalvox-client.so")}

    def environment(self):
        return {**os.environ, "PKG_CONFIG_PATH": str(self.libraries / "pkgconfig"),
                "LD_LIBRARY_PATH": str(self.libraries)}
