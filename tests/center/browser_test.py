"""The Package Center in headless Chromium: log in, install greeter from the store with its
wizard answered (hello comes along), see it running, stop it, see hello's uninstall refused
while greeter needs it, upgrade greeter once 1.1 is published, uninstall both. Each main
view is kept as a screenshot in CENTER_ARTEFACTS."""
import os
import shutil
import subprocess
import sys
import time
import unittest
import urllib.request

from selenium import webdriver
from selenium.common.exceptions import NoSuchElementException, StaleElementReferenceException
from selenium.webdriver.chrome.service import Service
from selenium.webdriver.common.by import By
from selenium.webdriver.support import expected_conditions as ready
from selenium.webdriver.support.ui import WebDriverWait

BASE = os.environ["CENTER_URL"]
ARTEFACTS = os.environ["CENTER_ARTEFACTS"]


def chromium():
    options = webdriver.ChromeOptions()
    options.binary_location = "/usr/bin/chromium"
    for flag in ["--headless=new", "--no-sandbox", "--disable-dev-shm-usage", "--disable-gpu",
                 "--window-size=1200,900", "--no-first-run", "--disable-extensions"]:
        options.add_argument(flag)
    service = Service(executable_path="/usr/bin/chromedriver")
    return webdriver.Chrome(service=service, options=options)


class PackageCenterInBrowser(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.browser = chromium()
        cls.wait = WebDriverWait(cls.browser, 30, poll_frequency=0.1,
                                 ignored_exceptions=[StaleElementReferenceException])

    @classmethod
    def tearDownClass(cls):
        cls.browser.quit()

    def shot(self, name):
        self.browser.save_screenshot(os.path.join(ARTEFACTS, name + ".png"))

    def find(self, selector):
        return self.wait.until(ready.visibility_of_element_located((By.CSS_SELECTOR, selector)))

    def click(self, selector):
        """Clicks, again when the page redrew the element between finding and clicking."""
        def clicked(browser):
            try:
                element = browser.find_element(By.CSS_SELECTOR, selector)
                if not (element.is_displayed() and element.is_enabled()):
                    return False
                element.click()
                return True
            except (NoSuchElementException, StaleElementReferenceException):
                return False
        self.wait.until(clicked)

    def text_in(self, selector, text):
        self.wait.until(ready.text_to_be_present_in_element((By.CSS_SELECTOR, selector), text))

    def answer_wizard(self, answers):
        self.find("#wizard[open]")
        for key, value in answers.items():
            field = self.find("#answer-" + key)
            field.clear()
            field.send_keys(value)
        if self.browser.find_element(By.ID, "wizard-signature").is_displayed():
            self.click("#wizard-accept-unsigned")
        self.shot("wizard")
        self.click("#wizard-submit")

    def wait_tasks_over(self):
        """Every task row shown has ended; a failed one fails the test with its words."""
        def over(browser):
            states = [t.get_attribute("data-state") for t in
                      browser.find_elements(By.CSS_SELECTOR, "#tasks .task")]
            return states and all(s in ("done", "failed", "cancelled") for s in states)
        self.wait.until(over)

    def clear_tasks(self):
        self.browser.execute_script("document.getElementById('tasks').replaceChildren()")

    def test_a_package_life_from_the_page(self):
        self.browser.get(BASE + "/")
        self.find("#login-user").send_keys("alice")
        self.find("#login-password").send_keys("alice-secret")
        self.shot("login")
        self.click("#login-submit")
        self.find("#installed-empty")

        # Install greeter from the store; hello, which it needs, comes first.
        self.click("#tab-store")
        self.find("#store-greeter .store-install")
        self.shot("store")
        self.click("#store-greeter .store-install")
        self.answer_wizard({"GREETER_GREETING": "Hello from the browser", "GREETER_PORT": "9123"})
        self.wait_tasks_over()
        self.assertEqual(self.browser.find_element(By.ID, "message").text, "")
        self.click("#tab-installed")
        self.text_in("#installed-greeter .status", "running")
        self.text_in("#installed-hello .status", "running")
        self.shot("installed")
        # The wizard's answers reached the package: it answers on the port chosen, with
        # the greeting given.
        with urllib.request.urlopen("http://127.0.0.1:9123/", timeout=10) as answer:
            self.assertIn("Hello from the browser", answer.read().decode())

        # Stop greeter from its details.
        self.click("#installed-greeter .details-link")
        self.text_in("#details-status", "running")
        self.click("#details-stop")
        self.text_in("#details-status", "stopped")
        self.shot("details")

        # hello cannot go while greeter depends on it: named before, refused after.
        self.clear_tasks()
        self.click("#tab-installed")
        self.click("#installed-hello .details-link")
        self.text_in("#details-dependents", "greeter")
        self.click("#details-uninstall")
        self.text_in("#confirm-text", "greeter")
        self.shot("uninstall-confirm")
        self.click("#confirm-ok")
        self.wait_tasks_over()
        self.text_in("#message", "depend on hello: Greeter")
        self.shot("uninstall-refused")

        # greeter 1.1 is published: the updates list offers it.
        shutil.copy(os.environ["CENTER_UPGRADE"], os.environ["CENTER_FEED_DIR"])
        subprocess.run([os.environ["CORV_STORE"], "index", os.environ["CENTER_FEED_DIR"]],
                       check=True, stdout=subprocess.DEVNULL)
        self.clear_tasks()
        self.click("#tab-updates")
        self.text_in("#update-greeter", "1.1.0-0001")
        self.shot("updates")
        self.click("#update-greeter .upgrade")
        self.answer_wizard({})
        self.wait_tasks_over()
        self.click("#tab-installed")
        self.text_in("#installed-greeter", "1.1.0-0001")

        # Uninstall greeter, then hello.
        for name in ["greeter", "hello"]:
            self.clear_tasks()
            self.click("#installed-" + name + " .details-link")
            self.text_in("#details-title", name.capitalize())
            self.click("#details-uninstall")
            self.click("#confirm-ok")
            self.wait_tasks_over()
            self.click("#tab-installed")
        self.find("#installed-empty")
        self.assertEqual(self.browser.find_element(By.ID, "message").text, "")
        self.shot("installed-empty")


if __name__ == "__main__":
    result = unittest.main(argv=[sys.argv[0], "-v"], exit=False).result
    sys.exit(0 if result.wasSuccessful() else 1)
