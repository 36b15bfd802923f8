"""Debian's chromium without a window, driven through its debugging pipe."""

import base64
import json
import os
import subprocess
import time

_FLAGS = (
    "--headless",
    "--no-sandbox",
    "--disable-gpu",
    "--disable-quic",
    "--no-first-run",
    "--disable-extensions",
    "--disable-background-networking",
    "--disable-component-update",
    "--disable-sync",
    "--disable-dev-shm-usage",
)


class Browser:
    """One page in a browser with a profile of its own; what it says while it loads is kept."""

    def __init__(self, profile):
        self.requests, self.complaints = [], []
        self._number, self._buffer = 0, b""
        here, there = os.pipe(), os.pipe()
        self._process = subprocess.Popen(
            [
                "bash",
                "-c",
                f'exec 3<&{here[0]} 4>&{there[1]}; exec chromium "$@"',
                "bash",
                *_FLAGS,
                "--remote-debugging-pipe",
                f"--user-data-dir={profile}",
                "about:blank",
            ],
            pass_fds=(here[0], there[1]),
            stdin=subprocess.DEVNULL,
            stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL,
        )
        os.close(here[0])
        os.close(there[1])
        self._to, self._from = here[1], there[0]
        target = self._ask("Target.createTarget", url="about:blank")["targetId"]
        self._session = self._ask("Target.attachToTarget", targetId=target, flatten=True)["sessionId"]
        for domain in ("Page", "Network", "Runtime", "Log"):
            self.ask(f"{domain}.enable")

    def close(self):
        os.close(self._to)
        os.close(self._from)
        self._process.kill()
        self._process.wait()

    def ask(self, method, **parameters):
        return self._ask(method, session=self._session, **parameters)

    def show(self, path, width=1200, scheme="light", media=""):
        """Loads a file and waits until it stands."""
        self.ask("Emulation.setDeviceMetricsOverride", width=width, height=900, deviceScaleFactor=1, mobile=width < 600)
        self.ask(
            "Emulation.setEmulatedMedia", media=media, features=[{"name": "prefers-color-scheme", "value": scheme}]
        )
        self.ask("Page.navigate", url=path.as_uri())
        limit = time.monotonic() + 60
        while self.run("location.protocol + document.readyState") != "file:complete":
            assert time.monotonic() < limit, "the page does not come up"
            time.sleep(0.05)

    def run(self, expression):
        """The value of an expression in the page, that of a promise when it is kept."""
        answer = self.ask("Runtime.evaluate", expression=expression, returnByValue=True, awaitPromise=True)
        assert "exceptionDetails" not in answer, answer
        return answer["result"].get("value")

    def texts(self, selector):
        """The texts of all elements that a selector finds."""
        return self.run(f"[...document.querySelectorAll({json.dumps(selector)})].map(e => e.textContent)")

    def brightness(self):
        """How bright the text and the background of the page are, each from 0 to 765."""
        return self.run(
            """(() => { const style = getComputedStyle(document.body);
            return [style.color, style.backgroundColor].map(c => c.match(/\\d+/g).map(Number)
                .slice(0, 3).reduce((a, b) => a + b)); })()"""
        )

    def picture(self, path):
        """Writes the whole page as a PNG file."""
        data = self.ask("Page.captureScreenshot", format="png", captureBeyondViewport=True)["data"]
        path.write_bytes(base64.b64decode(data))

    def _ask(self, method, session=None, **parameters):
        self._number += 1
        message = {"id": self._number, "method": method, "params": parameters}
        if session:
            message["sessionId"] = session
        os.write(self._to, json.dumps(message).encode() + b"\0")
        while True:
            answer = self._read()
            if answer.get("id") == self._number:
                assert "error" not in answer, (method, answer["error"])
                return answer["result"]
            self._note(answer)

    def _note(self, event):
        method, details = event.get("method"), event.get("params", {})
        if method == "Network.requestWillBeSent":
            self.requests.append(details["request"]["url"])
        elif method in (
            "Runtime.consoleAPICalled",
            "Runtime.exceptionThrown",
            "Log.entryAdded",
            "Page.javascriptDialogOpening",
        ):
            self.complaints.append(details)

    def _read(self):
        while b"\0" not in self._buffer:
            data = os.read(self._from, 1 << 20)
            if not data:
                raise EOFError(f"chromium has ended: {self._process.poll()}")
            self._buffer += data
        message, self._buffer = self._buffer.split(b"\0", 1)
        return json.loads(message)
