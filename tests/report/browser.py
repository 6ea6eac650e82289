"""A headless Chromium, and what tests of a page ask of it."""

import base64
import os
import time

from selenium import webdriver
from selenium.webdriver.chrome.options import Options
from selenium.webdriver.chrome.service import Service

FLAGS = ["--headless=new", "--no-sandbox", "--disable-gpu", "--hide-scrollbars",
         "--disable-dev-shm-usage", "--disable-background-networking", "--no-first-run"]


class Browser:
    def __init__(self, width=1200, height=900, dark=False):
        options = Options()
        for flag in [*FLAGS, f"--window-size={width},{height}"]:
            options.add_argument(flag)
        options.set_capability("goog:loggingPrefs", {"browser": "ALL"})
        self.driver = webdriver.Chrome(service=Service("/usr/bin/chromedriver"), options=options)
        self.resize(width, height)
        self.colours("dark" if dark else "light")

    def command(self, name, **arguments):
        return self.driver.execute_cdp_cmd(name, arguments)

    def resize(self, width, height=900):
        self.width = width
        self.command("Emulation.setDeviceMetricsOverride", width=width, height=height,
                     deviceScaleFactor=1, mobile=width < 600)

    def colours(self, scheme, medium=""):
        self.command("Emulation.setEmulatedMedia", media=medium, features=[
            {"name": "prefers-color-scheme", "value": scheme}])

    def open(self, path):
        self.driver.get(f"file://{path}")

    def run(self, script, *arguments):
        return self.driver.execute_script(script, *arguments)

    def wait_until(self, script, seconds=20):
        deadline = time.monotonic() + seconds
        while not self.run(f"return {script}"):
            if time.monotonic() > deadline:
                raise AssertionError(f"never true: {script}")
            time.sleep(0.02)

    def press(self, key, code=None):
        text = {"Enter": "\r", " ": " "}.get(key)
        for kind in ("keyDown", "keyUp"):
            event = {"type": kind, "key": key, "code": code or key,
                     "windowsVirtualKeyCode": {"Enter": 13, "Escape": 27, "Tab": 9, "ArrowRight": 39,
                                               "ArrowLeft": 37}.get(key, 0)}
            if text and kind == "keyDown":
                event["text"] = text
            self.command("Input.dispatchKeyEvent", **event)

    def complaints(self):
        return [entry["message"] for entry in self.driver.get_log("browser")]

    def axe(self, source):
        """What axe-core finds that is serious or critical: (impact, rule, elements)."""
        # Not as a script of the page: its policy would refuse it.
        self.command("Runtime.evaluate", expression=source)
        found = self.driver.execute_async_script(
            "const done = arguments[0]; axe.run().then((result) => done(result.violations))")
        return [(one["impact"], one["id"], [node["html"][:150] for node in one["nodes"]][:4])
                for one in found if one["impact"] in ("serious", "critical")]

    def picture(self, path, height=None):
        tall = self.run("return document.documentElement.scrollHeight")
        shot = self.command("Page.captureScreenshot", captureBeyondViewport=True, clip={
            "x": 0, "y": 0, "width": self.width, "height": min(tall, height or tall), "scale": 1})
        with open(path, "wb") as file:
            file.write(base64.b64decode(shot["data"]))

    def print(self, path):
        with open(path, "wb") as file:
            file.write(base64.b64decode(self.command("Page.printToPDF")["data"]))

    def close(self):
        self.driver.quit()


def axe_source():
    """None where it is not installed."""
    path = os.environ.get("AXE_CORE", "")
    if not os.path.isfile(path):
        return None
    with open(path, encoding="utf-8") as file:
        return file.read()
