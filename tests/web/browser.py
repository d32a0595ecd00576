"""A browser without a screen, and what a person does with the page in it."""

import tempfile

from selenium import webdriver
from selenium.common.exceptions import StaleElementReferenceException
from selenium.webdriver.chrome.service import Service
from selenium.webdriver.common.by import By

from world import CHECKOUT, wait_for

# More often than this the page does not change while one element is looked for.
CHANGES = 5
RESULTS = CHECKOUT / "build/test-results"
_OPTIONS = ("--headless=new", "--no-sandbox", "--disable-gpu", "--disable-dev-shm-usage", "--no-first-run",
            "--disable-background-networking", "--disable-component-update", "--hide-scrollbars")


class Browser:
    """One Chromium with one page open at a time."""

    def __init__(self):
        self._profile = tempfile.TemporaryDirectory(prefix="tarn-browser-")
        options = webdriver.ChromeOptions()
        for option in (*_OPTIONS, f"--user-data-dir={self._profile.name}"):
            options.add_argument(option)
        options.binary_location = "/usr/bin/chromium"
        options.set_capability("goog:loggingPrefs", {"browser": "ALL"})
        self.driver = webdriver.Chrome(service=Service("/usr/bin/chromedriver"), options=options)

    def close(self):
        self.driver.quit()
        self._profile.cleanup()

    def open(self, server, width=1000, height=800, **query):
        """Show the page of a server and wait until it stands."""
        self.driver.execute_cdp_cmd("Emulation.setDeviceMetricsOverride", {
            "width": width, "height": height, "deviceScaleFactor": 1, "mobile": width < 600})
        self.driver.get(server.url + "?" + "&".join(f"{name}={value}" for name, value in query.items()))
        self.wait(lambda: self.all("#view h2"), "the page")

    def all(self, selector):
        return self.driver.find_elements(By.CSS_SELECTOR, selector)

    def text(self, selector="#view"):
        """Visible text of the first element, empty when there is none."""
        def read():
            found = self.all(selector)
            return found[0].text if found else ""
        return _while_the_page_changes(read)

    def click(self, selector):
        _while_the_page_changes(lambda: self.all(selector)[0].click())

    def run(self, script, *arguments):
        """Run a script in the page; returns what it returns."""
        return self.driver.execute_script(script, *arguments)

    def wait(self, condition, what, timeout=20):
        return wait_for(condition, timeout, lambda: f"{what}; the page says: {self.text('body')}")

    def wait_text(self, text, selector="#view", timeout=20):
        self.wait(lambda: text in self.text(selector), f"{text!r}", timeout)

    def remove(self, selector):
        """Press a button for a removal, and answer the question with yes."""
        self.click(selector)
        self.click("#confirm")

    def later(self, seconds):
        """Let the page believe that so much time has passed."""
        self.run("var then = Date.now; Date.now = function() { return then() + arguments[0] * 1000; }"
                 ".bind(null, arguments[0]);", seconds)

    def pause(self, seconds):
        """Let the page go on for so long."""
        self.driver.execute_async_script("setTimeout(arguments[1], arguments[0] * 1000)", seconds)

    def picture(self, name):
        """Leave a picture of the page in the results."""
        RESULTS.mkdir(parents=True, exist_ok=True)
        self.driver.save_screenshot(str(RESULTS / f"{name}.png"))

    def complaints(self):
        """What the page complained of since the last call."""
        return [entry["message"] for entry in self.driver.get_log("browser") if entry["level"] == "SEVERE"]


def _while_the_page_changes(action):
    """The action's result; the page may replace an element between finding and using it."""
    for _ in range(CHANGES - 1):
        try:
            return action()
        except StaleElementReferenceException:
            continue
    return action()
