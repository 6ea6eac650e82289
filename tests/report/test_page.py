"""The report's page in a browser: that it shows what is in the store, to everybody.

HALYARDD and HALYARDCTL name the programs, AXE_CORE the file axe.min.js. Ends with 77
where no browser is installed.
"""

import os
import subprocess
import sys
import time
import unittest
from pathlib import Path

sys.dont_write_bytecode = True
sys.path.insert(0, str(Path(__file__).resolve().parent))

try:
    import browser
except ModuleNotFoundError as error:
    print(f"skipped: {error}; python3-selenium, chromium and chromium-driver are needed")
    sys.exit(77)
if not os.access("/usr/bin/chromedriver", os.X_OK):
    print("skipped: no chromium-driver here")
    sys.exit(77)

import stores  # noqa: E402

AXE = browser.axe_source()


class Page(unittest.TestCase):
    """One browser for all cases; each opens a page of its own store."""

    @classmethod
    def setUpClass(cls):
        cls.browser = browser.Browser()

    @classmethod
    def tearDownClass(cls):
        cls.browser.close()

    def setUp(self):
        self.browser.resize(1200)
        self.browser.colours("light")

    def show(self, fill):
        folder, state = stores.make(os.environ["HALYARDD"], fill)
        self.addCleanup(folder.cleanup)
        self.page = Path(folder.name) / "report.html"
        began = time.monotonic()
        subprocess.run([os.environ["HALYARDCTL"], "--state", state, "report", "--output",
                        self.page], check=True, stdout=subprocess.DEVNULL)
        self.took = time.monotonic() - began
        self.browser.open(self.page)
        self.browser.wait_until("document.documentElement.dataset.ready === 'yes'")

    def run_script(self, script, *arguments):
        return self.browser.run(script, *arguments)

    def text(self, selector):
        return self.run_script("return document.querySelector(arguments[0]).innerText", selector)

    def count(self, selector):
        return self.run_script("return document.querySelectorAll(arguments[0]).length", selector)

    def assertSound(self):
        """No complaint, nothing loaded, nothing that keeps somebody out, in any colours."""
        self.assertEqual(self.browser.complaints(), [])
        self.assertEqual(self.run_script("return performance.getEntriesByType('resource').length"), 0)
        for scheme in ("light", "dark") if AXE else ():
            self.browser.colours(scheme)
            self.assertEqual(self.browser.axe(AXE), [], scheme)
        self.browser.colours("light")
        self.browser.resize(360)
        self.browser.wait_until("document.documentElement.scrollWidth <= 360", 5)
        self.browser.resize(1200)

    def test_of_an_empty_store_says_that_there_is_nothing(self):
        self.show(lambda store: None)

        self.assertIn("Nothing was played or captured, and nothing was reported.", self.text("#answer"))
        self.assertEqual(self.count("main > section:not([hidden])"), 1)
        self.assertSound()

    def test_of_one_session_tells_what_played_and_what_was_missing(self):
        self.show(stores.one_session)

        answer = self.text("#answer").replace("\u00a0", " ")
        self.assertIn("In 1 session, 49 s were played. All of it came from music.", answer)
        self.assertIn("Sound was missing twice, at a rate of 147 an hour, for 360 ms in all", answer)
        self.assertEqual(self.count("#timeline .mark"), 2)
        self.assertEqual(self.count("#timeline path.route"), 1)
        self.assertEqual(self.count("#sessions figure"), 3)
        self.assertSound()

    def test_a_glitch_opens_its_evidence_by_click(self):
        self.show(stores.one_session)

        self.run_script("document.querySelectorAll('.mark')[0].dispatchEvent(new MouseEvent('click'))")

        evidence = self.text("#evidence").replace("\u00a0", " ")
        for words in ("320 ms", "the process was stopped", "out.speaker", "stopped", "2 ms"):
            self.assertIn(words, evidence)
        self.assertSound()

    def test_glitches_can_be_gone_through_with_the_keyboard_alone(self):
        self.show(stores.one_session)
        active = "document.activeElement"
        for _ in range(20):
            if self.run_script(f"return {active}.classList.contains('mark')"):
                break
            self.browser.press("Tab")

        self.browser.press("ArrowRight")
        self.assertIn("processor", self.run_script(f"return {active}.getAttribute('aria-label')"))
        self.browser.press("Enter")
        self.assertIn("Glitch at", self.run_script(f"return {active}.textContent"))
        self.assertIn("41 ms", self.text("#evidence").replace("\u00a0", " "))
        self.browser.press("Escape")
        self.assertTrue(self.run_script("return document.getElementById('evidence').hidden"))
        self.assertIn("processor", self.run_script(f"return {active}.getAttribute('aria-label')"))

    def test_the_table_finds_a_row_of_any_table(self):
        self.show(stores.one_session)

        self.run_script("""const kind = document.querySelector('#table select');
            kind.value = 'messages'; kind.dispatchEvent(new Event('change'));
            const search = document.querySelector('#table input');
            search.value = 'headphones ROUTECHANGE'; search.dispatchEvent(new Event('input'));""")

        self.browser.wait_until("document.querySelector('#table [role=status]').textContent.startsWith('1 to 1 of 1')")
        self.assertIn("out.headphones", self.text("#table tbody"))

    def test_the_button_changes_light_and_dark(self):
        self.show(stores.one_session)
        paper = "return getComputedStyle(document.documentElement).backgroundColor"
        light = self.run_script(paper)

        self.run_script("document.getElementById('theme').click()")

        self.assertNotEqual(self.run_script(paper), light)
        self.assertEqual(self.text("#theme"), "Light")

    def test_what_is_printed_is_light_and_without_buttons(self):
        self.show(stores.one_session)
        self.run_script("document.getElementById('theme').click()")

        self.browser.colours("dark", "print")

        self.assertEqual(self.run_script("return getComputedStyle(document.documentElement).backgroundColor"),
                         "rgb(255, 255, 255)")
        self.assertEqual(self.run_script("return document.getElementById('theme').offsetHeight"), 0)

    def test_of_a_large_store_stays_a_page(self):
        self.show(stores.large)

        paint = self.run_script("return performance.getEntriesByName('first-contentful-paint')[0].startTime")
        size = self.page.stat().st_size
        print(f"100,000 messages, 2,000 glitches: made in {self.took:.1f} s, {size / 1e6:.1f} MB, "
              f"first paint after {paint / 1000:.2f} s")
        self.assertLess(size, 10_000_000)
        self.assertIn("2,000 times", self.text("#answer"))
        self.assertLess(self.count("#timeline .mark"), 1500)
        self.run_script("""const kind = document.querySelector('#table select');
            kind.value = 'messages'; kind.dispatchEvent(new Event('change'));""")
        self.browser.wait_until("document.querySelector('#table [role=status]').textContent.includes('of 100,000')")
        self.assertEqual(self.count("#table tbody tr"), 50)
        self.assertSound()

    def test_names_of_any_kind_stay_texts(self):
        self.show(stores.hostile)
        for mark in range(self.count("#timeline .mark")):
            self.run_script("document.querySelectorAll('.mark')[arguments[0]].dispatchEvent(new MouseEvent('click'))", mark)
        self.run_script("document.querySelectorAll('details').forEach((one) => { one.open = true; })")
        for kind in ("sessions", "messages", "events"):
            self.run_script("""const kind = document.querySelector('#table select');
                kind.value = arguments[0]; kind.dispatchEvent(new Event('change'));""", kind)
            self.browser.wait_until("document.querySelector('#table caption') !== null")

        self.assertEqual(self.run_script("return document.title"), "How the sound did")
        self.assertEqual(self.count("img, iframe, script:not([type])"), 1)
        self.assertIn("</script><img src=x", self.text("#sums") + self.text("#sessions"))
        self.assertNotRegex(self.run_script("return document.querySelector('main').textContent"),
                            "[\u202a-\u202e\u2066-\u2069\u200b\x1b\x07]")
        self.assertSound()


if __name__ == "__main__":
    if AXE is None:
        print("axe-core is not here (npm ci in tests/report): nothing looks for what keeps people out")
    unittest.main()
