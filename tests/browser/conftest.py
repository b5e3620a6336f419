"""The page of `appsync serve`, in a browser, on the built command that APPSYNC names."""

import importlib.util
import json
import pathlib
import sys
import time

import pytest
from selenium import webdriver
from selenium.webdriver.chrome.options import Options
from selenium.webdriver.chrome.service import Service

ACCEPTANCE = pathlib.Path(__file__).resolve().parent.parent / "acceptance"
sys.path.insert(0, str(ACCEPTANCE))

_spec = importlib.util.spec_from_file_location("acceptance_conftest", ACCEPTANCE / "conftest.py")
acceptance = importlib.util.module_from_spec(_spec)
_spec.loader.exec_module(acceptance)
appsync = acceptance.appsync
nothing_runs_on = acceptance.nothing_runs_on

PATIENCE = 60  # seconds, at the most, for what the page is to show
WIDE = (1280, 900)
# As root, and in a container, a browser has no sandbox and little shared memory.
OPTIONS = ("--headless=new", "--no-sandbox", "--disable-dev-shm-usage", "--disable-gpu", "--disable-extensions")


@pytest.fixture(scope="session")
def driver():
    """One browser for all tests."""
    options = Options()
    options.binary_location = "/usr/bin/chromium"
    for option in OPTIONS:
        options.add_argument(option)
    options.set_capability("goog:loggingPrefs", {"browser": "ALL", "performance": "ALL"})
    driver = webdriver.Chrome(service=Service("/usr/bin/chromedriver"), options=options)
    yield driver
    driver.quit()


class Served:
    """`appsync serve` of a device or a folder."""

    def __init__(self, appsync, path, port=0):
        self.process = appsync.start("serve", path, "--port", port)
        line = self.process.stdout.readline()
        assert line.startswith("Serving at http://127.0.0.1:"), line + self.process.stderr.read()
        self.url = line.split()[2]
        self.port = int(self.url.split(":")[2].strip("/"))

    def end(self):
        self.process.terminate()
        assert self.process.wait(timeout=10) == 0


@pytest.fixture
def serve(appsync):
    def start(path, port=0):
        return Served(appsync, path, port)
    return start


class Page:
    """What a person sees of it, and does with it."""

    def __init__(self, driver):
        self.driver = driver
        self.accepted = []
        self.urls = []
        self.resize(*WIDE)
        self.forget()

    def resize(self, width, height):
        self.driver.execute_cdp_cmd("Emulation.setDeviceMetricsOverride", {
            "width": width, "height": height, "deviceScaleFactor": 1, "mobile": False})

    def forget(self):
        self.driver.get("about:blank")
        for kind in ("browser", "performance"):
            self.driver.get_log(kind)

    def open(self, served, place=""):
        """From nothing, also where only what follows the # differs."""
        self.origin = served.url
        self.driver.get("about:blank")
        self.driver.get(served.url + place)

    def run(self, script, *arguments):
        return self.driver.execute_script(script, *arguments)

    def wait(self, script, *arguments):
        """Until what the script gives is true; that value."""
        end = time.monotonic() + PATIENCE
        while True:
            value = self.run(script, *arguments)
            if value:
                return value
            assert time.monotonic() < end, f"it never came: {script}\n{self.text('body')[:3000]}"
            time.sleep(0.05)

    def text(self, selector):
        return self.run("return document.querySelector(arguments[0])?.innerText ?? ''", selector)

    def wait_for_text(self, selector, text):
        self.wait("return (document.querySelector(arguments[0])?.innerText ?? '').includes(arguments[1])", selector, text)

    def wait_for_opacity(self, condition):
        """Until there are icons on the home screen, and that of the first is as `condition` says ("< 1")."""
        icon = "document.querySelector('#icons .icon > *')"
        self.wait(f"return {icon} !== null && getComputedStyle({icon}).opacity {condition}")

    def tiles(self):
        """What stands on the home screen: identifier, name, state, whether it waits."""
        return self.run("""return [...document.querySelectorAll('#icons .app')].map((app) => ({
            identifier: app.dataset.identifier, name: app.querySelector('.name').textContent,
            state: app.dataset.state, waits: 'waiting' in app.dataset, label: app.ariaLabel}))""")

    def wait_for_tiles(self, states):
        """Until the home screen has these identifiers, each in its state."""
        self.wait("""const shown = Object.fromEntries([...document.querySelectorAll('#icons .app')]
            .map((app) => [app.dataset.identifier, app.dataset.state]));
            const wanted = arguments[0];
            return Object.keys(shown).length === Object.keys(wanted).length
                && Object.entries(wanted).every(([identifier, state]) => shown[identifier] === state)""", states)

    def press(self, *keys):
        webdriver.ActionChains(self.driver).send_keys(*keys).perform()

    def focused(self):
        """The identifier of the icon that has the focus, or else the id of what has it."""
        return self.run("return document.activeElement.dataset.identifier ?? document.activeElement.id")

    def accepts(self, text):
        """What the browser's console says of it is right: the test has made it so."""
        self.accepted.append(text)

    def complaints(self):
        messages = [entry["message"] for entry in self.driver.get_log("browser") if entry["level"] in ("SEVERE", "WARNING")]
        return [message for message in messages if not any(text in message for text in self.accepted)]

    def requested(self):
        events = (json.loads(entry["message"])["message"] for entry in self.driver.get_log("performance"))
        self.urls += [
            event["params"]["request"]["url"] for event in events if event["method"] == "Network.requestWillBeSent"
        ]
        return self.urls


@pytest.fixture
def page(driver):
    """Whatever is done with it, it complains of nothing, and asks for nothing from elsewhere."""
    page = Page(driver)
    yield page
    complaints = page.complaints()
    asked = page.requested()
    driver.get("about:blank")
    assert not complaints
    assert asked, "the log of requests holds nothing"
    assert [url for url in asked if not url.startswith((page.origin, "about:"))] == []
