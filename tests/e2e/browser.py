"""A headless browser, spoken to through the WebDriver protocol."""
import base64
import http.client
import json
import re
import shutil
import subprocess
import tempfile
import threading

# Nothing of the browser's own may ask the network. Root, as in a container, has no sandbox.
FLAGS = ["--headless", "--no-sandbox", "--disable-gpu", "--disable-quic", "--no-first-run",
         "--disable-background-networking", "--disable-component-update", "--disable-sync",
         "--disable-lcd-text"]  # pictures without coloured edges are half as large
PROGRAMS = [shutil.which("chromedriver"), shutil.which("chromium")]
IS_INSTALLED = all(PROGRAMS)
ENTER, TAB, RIGHT = "\ue007", "\ue004", "\ue014"


class Browser:
    def __init__(self):
        self.profile = tempfile.mkdtemp(prefix="tally-browser-")
        self.driver = subprocess.Popen([PROGRAMS[0], "--port=0"], stdout=subprocess.PIPE, stderr=subprocess.DEVNULL,
                                       text=True)
        self.session = ""
        try:
            lines = iter(self.driver.stdout.readline, "")
            self.port = next(int(found.group(1)) for line in lines if (found := re.search(r"successfully on port (\d+)", line)))
            threading.Thread(target=self.driver.stdout.read, daemon=True).start()
            options = {"binary": PROGRAMS[1], "args": [*FLAGS, f"--user-data-dir={self.profile}"]}
            made = self.call("POST", "/session", {"capabilities": {"alwaysMatch": {"goog:chromeOptions": options}}})
            self.session = "/session/" + made["sessionId"]
        except BaseException:
            self.close()
            raise

    def close(self):
        try:
            if self.session:
                self.call("DELETE", self.session)
        finally:
            self.driver.terminate()
            self.driver.wait()
            self.driver.stdout.close()
            shutil.rmtree(self.profile, ignore_errors=True)

    def call(self, method, path, body=None):
        connection = http.client.HTTPConnection("127.0.0.1", self.port, timeout=120)
        try:
            connection.request(method, path, json.dumps(body or {}) if method == "POST" else None)
            value = json.loads(connection.getresponse().read())["value"]
        finally:
            connection.close()
        if isinstance(value, dict) and "error" in value:
            raise RuntimeError(f"{path}: {value['error']}: {value['message'][:500]}")
        return value

    def command(self, path, **body):
        return self.call("POST", f"{self.session}/{path}", body)

    def devtools(self, name, **parameters):
        return self.command("goog/cdp/execute", cmd=name, params=parameters)

    def open(self, path, width=1280, height=900, scheme="light", mobile=False):
        """Opens a file in a window of that inner size."""
        self.devtools("Emulation.setDeviceMetricsOverride", width=width, height=height, deviceScaleFactor=1,
                      mobile=mobile)
        self.devtools("Emulation.setEmulatedMedia", features=[
            {"name": "prefers-color-scheme", "value": scheme}, {"name": "prefers-reduced-motion", "value": "reduce"}])
        self.command("url", url=f"file://{path}")

    def run(self, script, *arguments):
        """The result of a function's body; of what it promises, when that is fulfilled."""
        return self.command("execute/sync", script=script, args=list(arguments))

    def wait(self, condition):
        """Until an expression is true: it is looked at before each frame."""
        self.run("return new Promise((done) => { const look = () => { if (" + condition +
                 ") done(true); else requestAnimationFrame(look); }; look(); });")

    def settle(self):
        self.run("return new Promise((done) => requestAnimationFrame(() => requestAnimationFrame(() => done(1))));")

    def element(self, selector):
        found = self.command("element", using="css selector", value=selector)
        return "element/" + next(iter(found.values()))

    def click(self, selector):
        self.command(self.element(selector) + "/click")

    def type(self, selector, text):
        self.command(self.element(selector) + "/value", text=text)

    def press(self, *keys):
        """On what has the focus."""
        actions = [{"type": kind, "value": key} for key in keys for kind in ("keyDown", "keyUp")]
        self.command("actions", actions=[{"type": "key", "id": "keyboard", "actions": actions}])

    def picture(self):
        """PNG, of what is visible."""
        return base64.b64decode(self.call("GET", f"{self.session}/screenshot"))
