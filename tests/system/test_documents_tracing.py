"""The guide to tracing, with a real LTTng.

This module gives up being root for the rest of the process; see isolation.py.
"""

import os
import unittest

from document_runner import DocumentRunner, Place
from documents import ROOT
from harness import NOBODY, require
from installation import Installation
from isolation import program
from tracing import TracedService, require_tracer


class TracedPlace(Place):
    def __init__(self, service, libraries):
        self.service = service
        self.home = service.home
        state = self.home / ".local/state"
        state.mkdir(parents=True)
        (state / "halvox").symlink_to(service.directory / "state")
        own = os.environ.get("LD_LIBRARY_PATH")
        self.environment = {
            **os.environ, **service.environment, "HALVOX_CONFIG": str(service.config),
            "HALVOX_SOCKET": str(service.socket), "PKG_CONFIG_PATH": str(libraries / "pkgconfig"),
            "LD_LIBRARY_PATH": f"{libraries}:{own}" if own else str(libraries),
            "PATH": f"{program('halvoxctl').parent}:{os.environ['PATH']}"}


class TracingGuideTest(DocumentRunner, Installation):
    @classmethod
    def setUpClass(cls):
        if os.environ.get("HALVOX_SANITIZE"):
            raise unittest.SkipTest("a sanitized library needs a sanitized program")
        require("cc", "pkg-config")
        super().setUpClass()
        # The build is installed with the rights of its owner, then used and removed without.
        if os.getuid() == 0:
            for path in (cls.directory, *cls.directory.rglob("*")):
                os.chown(path, NOBODY, NOBODY, follow_symlinks=False)
        require_tracer()

    def test_the_guide_traces_a_program(self):
        with TracedService() as service:
            self.world = TracedPlace(service, self.libraries)
            self.check_document(ROOT / "docs/guides/tracing.md")


if __name__ == "__main__":
    unittest.main()
