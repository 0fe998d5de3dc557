"""A headless Chromium, driven by its DevTools protocol over a pair of pipes."""

import base64
import json
import os
import select
import shutil
import subprocess
import tempfile
import time

PATIENCE = 60


class Browser:
    """A browser of its own with one page; `with` ends it."""

    def __init__(self, program="chromium", dark=False):
        self.place = tempfile.mkdtemp(prefix="tamblo-browser-")
        self.number = 0
        self.session = None
        self.rest = b""
        self.events = []
        to_child, self.to = os.pipe()
        self.out, from_child = os.pipe()

        def arrange():  # the browser reads from descriptor 3 and writes to 4
            os.dup2(os.dup(to_child), 3)
            os.dup2(os.dup(from_child), 4)

        # A sandbox of its own is not to be had as root, nor in most containers; the page is the project's.
        self.process = subprocess.Popen(
            [program, "--headless=new", "--no-sandbox", "--disable-gpu", "--no-first-run", "--disable-extensions",
             "--disable-dev-shm-usage", "--hide-scrollbars", "--remote-debugging-pipe",
             f"--user-data-dir={self.place}", "about:blank"],
            preexec_fn=arrange, close_fds=False, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL)
        os.close(to_child)
        os.close(from_child)
        pages = [t for t in self.call("Target.getTargets")["targetInfos"] if t["type"] == "page"]
        target = pages[0]["targetId"] if pages else self.call("Target.createTarget", url="about:blank")["targetId"]
        self.session = self.call("Target.attachToTarget", targetId=target, flatten=True)["sessionId"]
        for domain in ("Page", "Runtime", "Log", "Network"):
            self.call(f"{domain}.enable")
        self.dark(dark)

    def __enter__(self):
        return self

    def __exit__(self, *_):
        try:
            self.session = None
            self.call("Browser.close")
            self.process.wait(10)
        except (OSError, RuntimeError, subprocess.TimeoutExpired):
            self.process.kill()
            self.process.wait()
        os.close(self.to)
        os.close(self.out)
        shutil.rmtree(self.place, ignore_errors=True)

    def call(self, method, **parameters):
        self.number += 1
        message = {"id": self.number, "method": method, "params": parameters}
        if self.session:
            message["sessionId"] = self.session
        os.write(self.to, json.dumps(message).encode() + b"\0")
        return self._await(lambda answer: answer.get("id") == self.number)

    def _await(self, wanted):
        end = time.monotonic() + PATIENCE
        while time.monotonic() < end:
            while b"\0" in self.rest:
                text, self.rest = self.rest.split(b"\0", 1)
                answer = json.loads(text)
                if "method" in answer:
                    self.events.append(answer)
                if wanted(answer):
                    if "error" in answer:
                        raise RuntimeError(str(answer["error"]))
                    return answer.get("result", answer)
            if select.select([self.out], [], [], 1)[0]:
                piece = os.read(self.out, 1 << 20)
                if not piece:
                    raise RuntimeError("the browser has ended")
                self.rest += piece
        raise RuntimeError("the browser does not answer")

    def dark(self, on):
        self.call("Emulation.setEmulatedMedia",
                  features=[{"name": "prefers-color-scheme", "value": "dark" if on else "light"}])

    def size(self, width, height):
        self.call("Emulation.setDeviceMetricsOverride", width=width, height=height, deviceScaleFactor=1,
                  mobile=False)

    def open(self, path):
        """Loads a page from its file."""
        self.events.clear()
        self.call("Page.navigate", url="file://" + os.path.abspath(path))
        self._await(lambda answer: answer.get("method") == "Page.loadEventFired")
        self.until("document.documentElement.dataset.state === 'whole'")

    def run(self, expression):
        """The value of an expression, awaited where it is a promise."""
        answer = self.call("Runtime.evaluate", expression=expression, awaitPromise=True, returnByValue=True)
        if "exceptionDetails" in answer:
            raise RuntimeError(str(answer["exceptionDetails"]))
        return answer["result"].get("value")

    def until(self, condition):
        end = time.monotonic() + PATIENCE
        while not self.run(condition):
            if time.monotonic() > end:
                raise RuntimeError("not within a minute: " + condition)
            time.sleep(0.05)

    def key(self, name, code=None):
        text = name if len(name) == 1 else ""
        for kind in ("keyDown", "keyUp"):
            self.call("Input.dispatchKeyEvent", type=kind, key=name, code=code or name,
                      text=text if kind == "keyDown" else "")

    def mouse(self, kind, x, y, buttons=0, **more):
        self.call("Input.dispatchMouseEvent", type=kind, x=x, y=y, button="left" if buttons else "none",
                  buttons=buttons, clickCount=1 if buttons else 0, **more)

    def complaints(self):
        """What the page threw or the browser logged about it, and what it asked of a network."""
        found = []
        for event in self.events:
            parameters = event.get("params", {})
            if event["method"] == "Runtime.exceptionThrown":
                details = parameters["exceptionDetails"]
                found.append(details.get("exception", {}).get("description", details["text"]))
            elif event["method"] == "Log.entryAdded":
                found.append(parameters["entry"]["text"])
            elif event["method"] == "Network.requestWillBeSent":
                url = parameters["request"]["url"]
                if parameters.get("type") != "Document":
                    found.append("asked for " + url)
        return found

    def screenshot(self, path, whole=False):
        picture = self.call("Page.captureScreenshot", format="png", captureBeyondViewport=whole)
        with open(path, "wb") as file:
            file.write(base64.b64decode(picture["data"]))

    def pdf(self, path):
        page = self.call("Page.printToPDF", printBackground=True)
        with open(path, "wb") as file:
            file.write(base64.b64decode(page["data"]))
