"""A headless Chromium that opens files of this machine. Speaks the DevTools protocol over a pipe."""

import base64
import itertools
import json
import os
import select
import shutil
import subprocess
import tempfile
import time

from harness import DEADLINE, WITH_US, stop_process, wait_for

# Everything that can share a process does, because two processors serve all tests. There is no
# sandbox, because it needs rights that a container does not give. The other options keep Chromium
# from looking for a network.
OPTIONS = [
    "--headless", "--no-sandbox", "--disable-gpu", "--remote-debugging-pipe", "--no-first-run",
    "--disable-background-networking", "--disable-component-update", "--disable-sync",
    "--disable-quic", "--disable-extensions", "--disable-dev-shm-usage", "--hide-scrollbars",
    "--force-color-profile=srgb",
]


def program():
    return shutil.which("chromium")


def missing():
    """Why pages cannot be opened on this machine; empty if they can."""
    return "" if program() else "chromium is not installed (scripts/setup installs it)"


class Browser:
    """Use as a context manager. Has one page."""

    def __enter__(self):
        self._directory = tempfile.mkdtemp(prefix="halvox-browser-")
        to_browser, self._write = os.pipe()
        self._read, from_browser = os.pipe()
        # The browser reads descriptor 3 and writes descriptor 4. Other shells than bash do not copy
        # descriptors of two digits.
        command = ["bash", "-c", f'exec 3<&{to_browser} 4>&{from_browser}; exec "$@"', "bash",
                   program(), *OPTIONS, f"--user-data-dir={self._directory}", "about:blank"]
        with open(os.path.join(self._directory, "log"), "wb") as log:
            self._process = subprocess.Popen(
                WITH_US + command, stdin=subprocess.DEVNULL, stdout=log, stderr=log,
                pass_fds=(to_browser, from_browser),
                env={**os.environ, "HOME": self._directory, "TZ": "UTC"})
        os.close(to_browser)
        os.close(from_browser)
        self._numbers = itertools.count(1)
        self._received = b""
        self._events = []
        self._session = None
        try:
            targets = self.call("Target.getTargets")["targetInfos"]
            target = next(info["targetId"] for info in targets if info["type"] == "page")
            self._session = self.call(
                "Target.attachToTarget", targetId=target, flatten=True)["sessionId"]
            # Without it, elements of a page that is not in front get no focus events.
            self.call("Emulation.setFocusEmulationEnabled", enabled=True)
            for domain in ("Page", "Runtime", "Log", "Network"):
                self.call(f"{domain}.enable")
        except BaseException:
            self.__exit__()
            raise
        return self

    def __exit__(self, *_):
        try:
            stop_process(self._process)
        finally:
            os.close(self._write)
            os.close(self._read)
            shutil.rmtree(self._directory, ignore_errors=True)

    def call(self, method, **parameters):
        """Sends a command of the protocol and returns its result."""
        number = next(self._numbers)
        message = {"id": number, "method": method, "params": parameters}
        if self._session:
            message["sessionId"] = self._session
        data = json.dumps(message).encode() + b"\0"
        while data:
            data = data[os.write(self._write, data):]
        while True:
            answer = self._receive()
            if answer.get("id") == number:
                if "error" in answer:
                    raise AssertionError(f"{method}: {answer['error']['message']}")
                return answer["result"]
            self._events.append(answer)

    def _receive(self):
        end = time.monotonic() + DEADLINE
        while b"\0" not in self._received:
            readable, _, _ = select.select([self._read], [], [], max(0, end - time.monotonic()))
            data = os.read(self._read, 1 << 20) if readable else b""
            if not data:
                raise AssertionError("chromium does not answer" if not readable else "chromium ended")
            self._received += data
        message, _, self._received = self._received.partition(b"\0")
        return json.loads(message)

    def open(self, path, width=1280, height=900, scheme="light", media="screen"):
        """Opens a file and waits until its page says that it is complete."""
        self._events.clear()
        self.resize(width, height)
        self.call("Emulation.setEmulatedMedia", media=media,
                  features=[{"name": "prefers-color-scheme", "value": scheme}])
        self.call("Page.navigate", url=f"file://{path}")
        self.wait_until("document.documentElement?.dataset.ready === 'true'")

    def resize(self, width, height):
        self.call("Emulation.setDeviceMetricsOverride", width=width, height=height,
                  deviceScaleFactor=1, mobile=False)

    def evaluate(self, expression):
        """The value of an expression in the page."""
        answer = self.call("Runtime.evaluate", expression=expression, returnByValue=True,
                           awaitPromise=True)
        if "exceptionDetails" in answer:
            raise AssertionError(f"{expression}: {json.dumps(answer['exceptionDetails'])}")
        return answer["result"].get("value")

    def wait_until(self, condition):
        end = time.monotonic() + DEADLINE
        while not self.evaluate(f"Boolean({condition})"):
            if time.monotonic() > end:
                raise AssertionError(f"the page did not reach {condition}; {self.problems()}")
            time.sleep(0.01)

    def frames(self):
        """Waits until what was changed is on the screen."""
        self.evaluate("new Promise(done => requestAnimationFrame(() => requestAnimationFrame(done)))")

    def press(self, key):
        for kind in ("keyDown", "keyUp"):
            self.call("Input.dispatchKeyEvent", type=kind, key=key, code=key,
                      windowsVirtualKeyCode={"Tab": 9, "Enter": 13, "ArrowLeft": 37, "ArrowRight": 39,
                                             "Home": 36, "End": 35}.get(key, 0),
                      **({"text": "\r"} if key == "Enter" and kind == "keyDown" else {}))

    def screenshot(self, path, whole=True):
        if whole:
            self._draw_all_pictures()
        self.frames()
        picture = self.call("Page.captureScreenshot", format="png", captureBeyondViewport=whole,
                            **({"clip": self._whole_page()} if whole else {}))
        with open(path, "wb") as file:
            file.write(base64.b64decode(picture["data"]))

    def _draw_all_pictures(self):
        """The page draws a picture when it comes near the screen."""
        count = self.evaluate("document.querySelectorAll('.frame').length")
        for number in range(count):
            frame = f"document.querySelectorAll('.frame')[{number}]"
            self.evaluate(frame + ".scrollIntoView()")
            wait_for("the picture", lambda: (self.frames(), self.evaluate(frame + ".childElementCount"))[1])
        self.evaluate("scrollTo(0, 0)")

    def _whole_page(self):
        size = self.call("Page.getLayoutMetrics")["cssContentSize"]
        return {"x": 0, "y": 0, "width": size["width"], "height": min(size["height"], 12000), "scale": 1}

    def accessibility_tree(self):
        """The nodes that a screen reader meets."""
        nodes = self.call("Accessibility.getFullAXTree")["nodes"]
        return [node for node in nodes if not node.get("ignored")]

    def problems(self):
        """Errors of scripts, refused content and requests to a network since the page was opened."""
        self.evaluate("1")  # what was reported before this answer has arrived
        found = []
        for event in self._events:
            kind, parameters = event.get("method"), event.get("params", {})
            if kind == "Runtime.exceptionThrown":
                details = parameters["exceptionDetails"]
                found.append(details.get("exception", {}).get("description", details["text"]))
            elif kind == "Log.entryAdded" and parameters["entry"]["level"] == "error":
                found.append(parameters["entry"]["text"])
            elif kind == "Network.requestWillBeSent":
                url = parameters["request"]["url"]
                if not url.startswith("file:"):
                    found.append(f"request to {url[:100]}")
        return found
