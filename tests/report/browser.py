"""A browser without a window, driven over its own debugging pipe.

Chromium started with --remote-debugging-pipe reads requests on descriptor 3 and writes answers and
events to descriptor 4: JSON texts, each ended by a zero byte.
"""

import base64
import json
import os
import select
import shutil
import subprocess
import tempfile
import time

NAMES = ("chromium", "chromium-browser", "google-chrome")
SWITCHES = ("--headless", "--no-sandbox", "--disable-gpu", "--disable-quic", "--no-first-run",
            "--disable-background-networking", "--disable-component-update", "--disable-sync",
            "--disable-dev-shm-usage", "--hide-scrollbars", "--remote-debugging-pipe")


class BrowserError(Exception):
    """The browser is missing, has ended, or did not answer."""


def program():
    for name in NAMES:
        path = shutil.which(name)
        if path:
            return path
    raise BrowserError("no browser: apt-get install chromium")


class Browser:
    """One browser with one page. What the page does that it should not is gathered."""

    def __init__(self, patience_seconds=60):
        self._patience_seconds = patience_seconds
        self._profile = tempfile.mkdtemp(prefix="spacekeep-browser-")
        self._buffer = b""
        self._last = 0
        self._session = None
        self.complaints = []  # texts of the console, errors, refused loads
        self.loads = []  # every address that was asked for
        try:
            self._start()
        except BaseException:
            self.close()
            raise

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def _start(self):
        read_end, self._to = os.pipe()
        self._from, write_end = os.pipe()

        def hand_over():
            # Copies first: one of the two may already have the other's number.
            source, sink = os.dup(read_end), os.dup(write_end)
            os.dup2(source, 3)
            os.dup2(sink, 4)

        self._process = subprocess.Popen(
            [program(), *SWITCHES, f"--user-data-dir={self._profile}", "about:blank"],
            preexec_fn=hand_over, close_fds=False, stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL)
        os.close(read_end)
        os.close(write_end)
        target = self.call("Target.createTarget", url="about:blank")["targetId"]
        self._session = self.call("Target.attachToTarget", targetId=target,
                                  flatten=True)["sessionId"]
        for domain in ("Page", "Runtime", "Log", "Network"):
            self.call(f"{domain}.enable")

    def close(self):
        process = getattr(self, "_process", None)
        if process is not None:
            process.terminate()
            try:
                process.wait(10)
            except subprocess.TimeoutExpired:
                process.kill()
                process.wait()
            os.close(self._to)
            os.close(self._from)
        shutil.rmtree(self._profile, ignore_errors=True)

    def call(self, method, **parameters):
        """Answers the result; raises for an error or a browser that is silent."""
        self._last += 1
        message = {"id": self._last, "method": method, "params": parameters}
        if self._session:
            message["sessionId"] = self._session
        os.write(self._to, json.dumps(message).encode() + b"\0")
        deadline = time.monotonic() + self._patience_seconds
        while True:
            answer = self._message(deadline)
            if answer.get("id") == self._last:
                if "error" in answer:
                    raise BrowserError(f"{method}: {answer['error']['message']}")
                return answer["result"]
            self._note(answer)

    def _message(self, deadline):
        while b"\0" not in self._buffer:
            rest = deadline - time.monotonic()
            if rest <= 0 or not select.select([self._from], [], [], rest)[0]:
                raise BrowserError("the browser does not answer")
            part = os.read(self._from, 1 << 20)
            if not part:
                raise BrowserError("the browser has ended")
            self._buffer += part
        text, self._buffer = self._buffer.split(b"\0", 1)
        return json.loads(text)

    def _note(self, event):
        method, parameters = event.get("method"), event.get("params", {})
        if method == "Runtime.exceptionThrown":
            details = parameters["exceptionDetails"]
            self.complaints.append(details.get("exception", {}).get("description", details["text"]))
        elif method == "Runtime.consoleAPICalled":
            self.complaints.append("console: " + str(parameters["args"]))
        elif method == "Log.entryAdded":
            self.complaints.append(parameters["entry"]["text"])
        elif method == "Network.requestWillBeSent":
            self.loads.append(parameters["request"]["url"])

    def look(self, width=1280, height=900, dark=False):
        """The screen, and whether its owner likes it dark."""
        self.call("Emulation.setDeviceMetricsOverride", width=width, height=height,
                  deviceScaleFactor=1, mobile=width < 600)
        self.call("Emulation.setEmulatedMedia", media="",
                  features=[{"name": "prefers-color-scheme", "value": "dark" if dark else "light"}])

    def open(self, path):
        """Loads a file and waits until it says that it is drawn. Answers the milliseconds from the
        begin of the navigation to a frame with all of it, by the page's own clock."""
        self.call("Page.navigate", url="file://" + os.path.abspath(path))
        deadline = time.monotonic() + self._patience_seconds
        while not self.value("document.documentElement?.dataset.drawn !== undefined"):
            if time.monotonic() > deadline:
                raise BrowserError(f"{path} was not drawn: {self.complaints}")
            time.sleep(0.02)
        # Two frames on, what was drawn has been laid out and painted.
        return self.value("new Promise((done) => requestAnimationFrame(() => "
                          "requestAnimationFrame(() => done(performance.now()))))")

    def value(self, expression):
        answer = self.call("Runtime.evaluate", expression=expression, returnByValue=True,
                           awaitPromise=True)
        if "exceptionDetails" in answer:
            raise BrowserError(f"{expression}: {answer['exceptionDetails']}")
        return answer["result"].get("value")

    def press(self, key, code=0):
        for kind in ("keyDown", "keyUp"):
            self.call("Input.dispatchKeyEvent", type=kind, key=key, code=key,
                      windowsVirtualKeyCode=code, text="\r" if key == "Enter" else "")

    def picture(self, path, whole=True):
        """Writes a PNG of the page, or of the screen alone."""
        answer = self.call("Page.captureScreenshot", format="png", captureBeyondViewport=whole)
        with open(path, "wb") as file:
            file.write(base64.b64decode(answer["data"]))

    def paper(self, path):
        """Writes the page as it would be printed."""
        answer = self.call("Page.printToPDF", printBackground=False)
        with open(path, "wb") as file:
            file.write(base64.b64decode(answer["data"]))
