"""Chromium without a window. Notices errors on the console and requests to other servers."""

import json

from selenium import webdriver
from selenium.webdriver.chrome.service import Service
from selenium.webdriver.common.action_chains import ActionChains
from selenium.webdriver.common.by import By

from appliance import BASE, wait_for

CHROMIUM = "/usr/bin/chromium"
DRIVER = "/usr/bin/chromedriver"
DESKTOP = (1280, 800)
PHONE = (320, 640)


# Gives the test control of a page: it says which requests fail, when the server sends an event and
# when the pauses of the page end.
CONTROL = """
  window.failing = null; // pattern of the addresses whose requests fail
  const fetchReally = window.fetch;
  window.fetch = async (address) =>
    failing?.test(address) ? new Response("", { status: 503 }) : fetchReally(address);
  const timers = new Map();
  let lastTimer = 0;
  window.setTimeout = (work, delay) => {
    timers.set(++lastTimer, { work, delay });
    return lastTimer;
  };
  window.clearTimeout = (timer) => timers.delete(timer);
  window.pauses = () => [...timers.values()].map(({ delay }) => Math.round(delay / 1000)).join();
  window.endPauses = () => {
    const ended = [...timers.values()];
    timers.clear();
    ended.forEach(({ work }) => work());
  };
  window.EventSource = class extends EventTarget {
    constructor() {
      super();
      window.send = (event) => this.dispatchEvent(new Event(event));
    }
    close() {
      window.send = null;
    }
  };
"""


class Browser:
    def __init__(self):
        options = webdriver.ChromeOptions()
        options.binary_location = CHROMIUM
        for argument in (
            "--headless=new",
            "--no-sandbox",  # root, in a private root: all pages are our own
            "--disable-gpu",
            "--disable-dev-shm-usage",
            "--disable-background-networking",
            "--disable-component-update",
            "--no-first-run",
            "--hide-scrollbars",
            "--user-data-dir=/tmp/chromium",
        ):
            options.add_argument(argument)
        options.set_capability("goog:loggingPrefs", {"browser": "ALL", "performance": "ALL"})
        self.driver = webdriver.Chrome(options=options, service=Service(DRIVER, log_path="/tmp/chromedriver.log"))
        self.driver.set_script_timeout(60)
        self.driver.set_page_load_timeout(60)

    def become(self, size=DESKTOP, dark=False, scripts=True):
        """Sets what the user's device is like."""
        self.driver.get("about:blank")
        self.set_size(size)
        self.set_dark(dark)
        self.command("Emulation.setScriptExecutionDisabled", value=not scripts)
        self.driver.get_log("browser")
        self.driver.get_log("performance")

    def set_size(self, size):
        self.command(
            "Emulation.setDeviceMetricsOverride",
            width=size[0],
            height=size[1],
            deviceScaleFactor=1,
            mobile=size[0] < 500,
        )

    def set_dark(self, dark):
        features = [{"name": "prefers-color-scheme", "value": "dark" if dark else "light"}]
        self.command("Emulation.setEmulatedMedia", features=features)

    def command(self, name, **parameters):
        return self.driver.execute_cdp_cmd(name, parameters)

    def open_controlled(self, path):
        """Opens the page with what CONTROL defines."""
        script = self.command("Page.addScriptToEvaluateOnNewDocument", source=CONTROL)
        try:
            self.open(path)
        finally:
            self.command("Page.removeScriptToEvaluateOnNewDocument", identifier=script["identifier"])

    def open(self, path):
        self.driver.get(BASE + path)

    def open_controlled(self, path):
        """Opens the page with what CONTROL defines."""
        script = self.command("Page.addScriptToEvaluateOnNewDocument", source=CONTROL)
        self.open(path)
        self.command("Page.removeScriptToEvaluateOnNewDocument", **script)

    def run(self, script, *arguments):
        return self.driver.execute_script(script, *arguments)

    def path(self):
        return self.driver.current_url.removeprefix(BASE)

    def one(self, selector):
        return wait_for(lambda: self.driver.find_elements(By.CSS_SELECTOR, selector), selector, 20)[0]

    def all(self, selector):
        return self.driver.find_elements(By.CSS_SELECTOR, selector)

    def texts(self, selector):
        return self.run("return [...document.querySelectorAll(arguments[0])].map(e => e.textContent)", selector)

    def wait(self, script, *arguments):
        """Waits until the expression is true; returns it."""
        return wait_for(lambda: self.run("return " + script, *arguments), script, 20)

    def press(self, *keys):
        for key in keys:
            ActionChains(self.driver).send_keys(key).perform()

    def complaints(self):
        """What was on the console, and what was requested from elsewhere, since the last call."""
        found = [entry["message"] for entry in self.driver.get_log("browser")]
        for entry in self.driver.get_log("performance"):
            message = json.loads(entry["message"])["message"]
            if message["method"] == "Network.requestWillBeSent":
                url = message["params"]["request"]["url"]
                if not url.startswith((BASE + "/", "data:", "about:")):
                    found.append("request to elsewhere: " + url)
        return found

    def quit(self):
        self.driver.quit()
