#!/usr/bin/python3
"""The web pages in headless Chromium against the real system in a sandbox.

One person's visit, step by step: sign in, search and page through the
results, download a hit, add a folder with the picker and watch it finish,
pause for an hour and resume, sign out. Each step saves a screenshot in the
folder given by --screenshots. Exits 77 (skipped) when Chromium, its driver
or python3-selenium is missing.

    tests/web/web_browser_test.py --source . --build build --screenshots build/browser-screenshots
"""
import argparse
import json
import os
import shutil
import socket
import subprocess
import sys
import tempfile
import time
import unittest

try:
    from selenium import webdriver
    from selenium.webdriver.chrome.service import Service
    from selenium.common.exceptions import NoSuchElementException, StaleElementReferenceException
    from selenium.webdriver.common.by import By
    from selenium.webdriver.common.keys import Keys
    from selenium.webdriver.support.ui import WebDriverWait
except ImportError:
    print("skipped: python3-selenium is not installed (scripts/bootstrap installs it)")
    sys.exit(77)

ARGS = None
TIMEOUT = 60  # seconds; generous, the machine may be loaded


def free_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


def shell(env, script):
    """Runs `script` with the system's shell helpers loaded."""
    subprocess.run(["bash", "-c", 'source "$FILEINDEX_SRC/scripts/lib/system.sh"; ' + script], env=env, check=True)


class WebPagesTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.browser = None
        try:
            cls.start()
        except BaseException:
            cls.tearDownClass()
            raise

    @classmethod
    def start(cls):
        cls.work = tempfile.mkdtemp(prefix="fileindex-browser-")
        os.chmod(cls.work, 0o755)
        root = os.path.join(cls.work, "root")
        sample = os.path.join(cls.work, "volume1", "sample")
        extra = os.path.join(cls.work, "volume1", "extra")
        subprocess.run([os.path.join(ARGS.source, "scripts", "sample-tree"), sample], check=True, stdout=subprocess.DEVNULL)
        # Enough hits for three pages of twenty.
        os.makedirs(os.path.join(sample, "logbook"))
        for day in range(45):
            with open(os.path.join(sample, "logbook", "day-%02d.txt" % day), "w") as out:
                out.write("Logbook entry %d: the pelican came to the quay again.\n" % day)
        os.makedirs(os.path.join(extra, "letters", "old"))
        for number in range(12):
            with open(os.path.join(extra, "letters", "letter-%d.txt" % number), "w") as out:
                out.write("A letter about the windmill, number %d.\n" % number)
        os.makedirs(os.path.join(root, "etc", "corvlumex"))
        with open(os.path.join(root, "etc", "corvlumex", "shares.json"), "w") as out:
            json.dump([{"name": "sample", "path": sample}, {"name": "extra", "path": extra}], out)
        cls.port = free_port()
        cls.env = dict(os.environ, FILEINDEX_SRC=ARGS.source, FILEINDEX_BUILD=ARGS.build, CORVLUMEX_ROOT=root)
        cls.cli = os.path.join(ARGS.build, "programs", "fileindex", "fileindex")
        shell(cls.env, "system_start > /dev/null")
        subprocess.run([cls.cli, "folder", "add", "/sample", "--wait", "--timeout", "120"], env=cls.env, check=True,
                       stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        shell(cls.env, "system_web_start %d" % cls.port)
        with open(os.path.join(root, "var", "run", "fileindex-web.sign-in")) as link:
            cls.link = link.read().strip()
        cls.base = "http://127.0.0.1:%d" % cls.port
        cls.downloads = os.path.join(cls.work, "downloads")
        os.makedirs(cls.downloads)
        options = webdriver.ChromeOptions()
        options.binary_location = shutil.which("chromium") or "/usr/bin/chromium"
        for flag in ["--headless", "--no-sandbox", "--disable-gpu", "--disable-quic", "--no-first-run",
                     "--disable-background-networking", "--disable-component-update", "--disable-sync",
                     "--user-data-dir=" + os.path.join(cls.work, "chromium-profile"), "--window-size=1100,900"]:
            options.add_argument(flag)
        options.add_experimental_option("prefs", {"download.default_directory": cls.downloads,
                                                  "download.prompt_for_download": False})
        service = Service(executable_path=shutil.which("chromedriver") or "/usr/bin/chromedriver")
        cls.browser = webdriver.Chrome(options=options, service=service)
        cls.browser.implicitly_wait(0)

    @classmethod
    def tearDownClass(cls):
        if cls.browser is not None:
            cls.browser.quit()
        if hasattr(cls, "env"):
            shell(cls.env, "system_stop > /dev/null")
        shutil.rmtree(cls.work, ignore_errors=True)

    def wait(self, condition, what):
        # The administration page redraws its tables every 2 s: an element
        # found just before a redraw is stale, and simply looked up again.
        return WebDriverWait(self.browser, TIMEOUT, poll_frequency=0.2,
                             ignored_exceptions=[NoSuchElementException, StaleElementReferenceException]).until(
                                 lambda b: condition(), message=what)

    def find(self, css):
        return self.browser.find_element(By.CSS_SELECTOR, css)

    def text(self, css):
        elements = self.browser.find_elements(By.CSS_SELECTOR, css)
        return elements[0].text if elements else ""

    def shot(self, name):
        os.makedirs(ARGS.screenshots, exist_ok=True)
        self.browser.save_screenshot(os.path.join(ARGS.screenshots, name + ".png"))

    def fits_phone(self, name):
        """On a phone-sized screen nothing needs scrolling sideways."""
        self.browser.set_window_size(390, 844)
        self.wait(lambda: self.browser.execute_script(
            "return document.documentElement.scrollWidth <= document.documentElement.clientWidth"), "fits a phone")
        self.shot(name)
        self.browser.set_window_size(1100, 900)

    def test_1_sign_in(self):
        # A wrong password is refused on the form, with a message.
        self.browser.get(self.base + "/")
        self.wait(lambda: "sign-in.html" in self.browser.current_url, "the search page sends strangers to sign in")
        self.find("#user-name").send_keys("nobody-here")
        self.find("#password").send_keys("wrong" + Keys.ENTER)
        self.wait(lambda: "wrong user name or password" in self.text("#message"), "a refused sign-in says so")
        self.shot("1-sign-in-refused")
        # The sandbox's one-time link signs the person who started it in.
        self.browser.get(self.link)
        self.wait(lambda: self.text("#user") != "", "the signed-in user is shown")
        self.assertFalse(self.find("#admin-link").get_attribute("hidden"))
        self.shot("1-signed-in")

    def test_2_search_and_page(self):
        box = self.find("#q")
        box.clear()
        box.send_keys("pelican" + Keys.ENTER)
        self.wait(lambda: self.text("#summary") == "45 found", "45 hits are counted")
        self.assertEqual(len(self.browser.find_elements(By.CSS_SELECTOR, "#results li")), 20)
        self.assertIn("pelican", self.text("#results li mark").lower())
        self.shot("2-search-page-1")
        self.find("#next").click()
        self.wait(lambda: self.text("#page-info") == "21–40 of 45", "the second page")
        self.find("#next").click()
        self.wait(lambda: self.text("#page-info") == "41–45 of 45", "the last page")
        self.assertTrue(self.find("#next").get_attribute("disabled"))
        self.shot("2-search-page-3")
        self.fits_phone("2-search-phone")

    def test_3_download(self):
        box = self.find("#q")
        box.clear()
        box.send_keys("saffron rice" + Keys.ENTER)
        self.wait(lambda: self.text("#summary") == "1 found", "one recipe found")
        link = self.find("#results li a.name")
        name = link.text
        link.click()
        path = os.path.join(self.downloads, name)
        self.wait(lambda: os.path.exists(path) and not os.path.exists(path + ".crdownload"), "the file is downloaded")
        with open(path) as got:
            self.assertIn("saffron", got.read())
        self.shot("3-downloaded")

    def test_4_add_folder(self):
        self.browser.get(self.base + "/admin.html")
        self.wait(lambda: "finished" in self.text("#folders"), "the sample share is listed as indexed")
        self.find("#browse").click()
        self.wait(lambda: "extra/" in self.text("#picker"), "the picker lists the shares")
        self.browser.find_element(By.XPATH, "//ul[@id='picker']//button[text()='extra/']").click()
        self.wait(lambda: "letters/" in self.text("#picker"), "the picker opens a share")
        self.browser.find_element(By.XPATH, "//ul[@id='picker']//button[text()='letters/']").click()
        self.wait(lambda: self.find("#add-path").get_attribute("value") == "/extra/letters", "the folder is chosen")
        self.find("#add-video").click()  # no videos in letters
        self.find("#add-form button[type=submit]").click()
        self.wait(lambda: "/extra/letters" in self.text("#folders"), "the new folder is listed")
        self.shot("4-folder-added")
        row = "//tbody[@id='folders']/tr[contains(., '/extra/letters')]"
        self.wait(lambda: "finished" in self.browser.find_element(By.XPATH, row).text, "the new folder finishes")
        self.shot("4-folder-finished")
        self.fits_phone("4-admin-phone")

    def test_5_pause_and_resume(self):
        hours = self.find("#pause-hours")
        hours.clear()
        hours.send_keys("1")
        self.find("#pause").click()
        self.wait(lambda: self.text("#pause-state").startswith("Paused until"), "paused for an hour")
        status = json.loads(subprocess.run([self.cli, "--json", "status"], env=self.env, capture_output=True, check=True).stdout)
        self.assertGreater(status["resume_time"], time.time() + 3000)
        self.shot("5-paused")
        self.find("#resume").click()
        self.wait(lambda: self.text("#pause-state").startswith("Running"), "running again")
        self.shot("5-resumed")

    def test_6_sign_out(self):
        self.find("#sign-out").click()
        self.wait(lambda: "sign-in.html" in self.browser.current_url, "signed out")
        self.browser.get(self.base + "/admin.html")
        self.wait(lambda: "sign-in.html" in self.browser.current_url, "the session is gone")
        self.shot("6-signed-out")


def main():
    global ARGS
    parser = argparse.ArgumentParser()
    parser.add_argument("--source", required=True)
    parser.add_argument("--build", required=True)
    parser.add_argument("--screenshots", required=True)
    ARGS, rest = parser.parse_known_args()
    ARGS.source, ARGS.build = os.path.abspath(ARGS.source), os.path.abspath(ARGS.build)
    if not shutil.which("chromium") or not shutil.which("chromedriver"):
        print("skipped: chromium and chromium-driver are not installed (scripts/bootstrap installs them)")
        sys.exit(77)
    unittest.main(argv=[sys.argv[0]] + rest, verbosity=2)


if __name__ == "__main__":
    main()
