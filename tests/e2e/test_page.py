"""The owner's page in a real browser: what it says, and that everybody can use it."""
import base64
import os
import pathlib
import plistlib
import re
import stat
import unittest

import browser
from browser import ENTER, RIGHT, TAB, Browser
from device import TODAY, WHITELIST, Device, group
from installed import main_with_optional_clients

TOP = pathlib.Path(__file__).resolve().parent.parent.parent
AXE = TOP / "build/npm-clients/node_modules/axe-core/axe.min.js"
# Names that try to become markup, a command of a shell, or an option.
MINUS = "\u2212"
HOSTILE = "</script><img src=x onerror=alert(1)>\u2028<!--"
GROUP = "-G'; touch /tmp/x #<b>"
MANY = 100_000


@unittest.skipUnless(browser.IS_INSTALLED, "chromium and its driver are not installed")
class PageTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.device = device = Device()
        cls.addClassCleanup(device.remove)
        device.describe()
        device.whitelist(Main=group({"exact": {}, "kept": {"bucket_interval": 10}, HOSTILE: {}, "gone": {}},
                                    {"waits": {"intervals": [10, 20]}}),
                         Off=group({"off": {}}), **{GROUP: group({"grouped": {"sig_fig": 2}})})
        device.write("Library/Application Support/Tallybook/Metrics.plist", {"Metrics": [
            {"Key": "kept", "Type": "gauge", "Unit": "ms", "Description": "time that it <b>took</b>"}]})
        device.set_preferences("vellum.da", Off=False)
        yesterday = TODAY - 1
        device.store([("kept", yesterday - 1, 50), ("gone", yesterday - 1, 1), ("exact", yesterday - 1, 7)])
        device.store([("kept", yesterday, 123), ("exact", yesterday, 7), (HOSTILE, yesterday, 2 ** 63 - 1),
                      ("grouped", yesterday, 987), ("off", yesterday, 1), ("unlisted", yesterday, 1)],
                     [("waits", yesterday, [5.0, 12.5, 12.5, 30.0])])
        for day in (yesterday, TODAY):
            device.run("-d", day=day)
        device.store([("exact", TODAY, 8)])
        cls.browser = Browser()
        cls.addClassCleanup(cls.browser.close)
        cls.page = cls.write()

    @classmethod
    def write(cls, name="page.html", device=None, *more):
        device = device or cls.device
        path = device.root / name
        device.tool("report", "page", "-o", str(path), *more, day=TODAY)
        return path

    def open(self, log=1, page=None, **window):
        self.browser.command("url", url="about:blank")
        self.browser.open(f"{page or self.page}#log-{log}", **window)
        return self.browser

    def search(self, text):
        self.browser.run("const query = document.getElementById('query'); query.value = arguments[0];"
                         "query.dispatchEvent(new Event('input')); document.getElementById('count').textContent = '';", text)
        self.browser.wait("document.getElementById('count').textContent !== ''")
        self.browser.settle()

    def text(self, selector):
        return self.browser.run("return [...document.querySelectorAll(arguments[0])].map((one) => one.innerText);", selector)

    def keys(self, view="leaves"):
        return self.text(f"#panel-{view} .key")

    def show(self, view):
        self.browser.click(f"#tab-{view}")

    def row(self, key):
        """The cells of a key and, unfolded, its details."""
        self.search(key)
        self.browser.run("document.querySelector('button.fold').click();")
        return [text for row in self.text("#panel-leaves tbody tr") for text in row.split("\t")]

    def test_a_key_is_shown_with_all_that_it_stands_for(self):
        self.open()
        cases = [
            ("kept", ["120\u00a0ms", "115 \u2013 124", "+70", "rounded to the nearest multiple of 10", "10 values from 115 to 124",
                      "tallyctl prefs set Main false --domain vellum.da", "time that it <b>took</b>", "bits a day"]),
            ("exact", ["7", "exactly this", "same", "the reported value is the true one"]),
            ("grouped", ["990", "985 \u2013 994", "new",
                         "tallyctl prefs set --domain vellum.da -- '-G'\\''; touch /tmp/x #<b>' false"]),
            ("</script>", ["9,223,372,036,854,775,807", "exactly this"]),
            ("waits", ["4 samples", "5 to 30", "mean 15", "up to 10", "above 10, up to 20", "above 20", "50.0 %"]),
        ]
        for key, parts in cases:
            shown = "\n".join(self.row(key))
            for part in parts:
                self.assertIn(part, shown, key)
        bars = self.browser.run("return [...document.querySelectorAll('.histogram .fill')].map((bar) => bar.getAttribute('width'));")
        self.assertEqual(bars, ["50.00", "100.00", "50.00"])

    def test_negative_values_turned_letters_and_a_log_that_may_not_leave(self):
        device = Device()
        self.addCleanup(device.remove)
        device.whitelist(Main=group({"n\u202em": {"bucket_interval": 100}}))
        device.store([("n\u202em", TODAY - 1, -150)])
        device.set_preferences("vellum.tallyd", DiagnosticSubmissionEnabled=False)
        self.open(0, self.write(device=device))
        self.assertEqual(self.keys(), ["n\\u202em"])
        self.assertIn(f"{MINUS}249 \u2013 {MINUS}150", self.row("n"))
        self.assertIn("Keys that would leave", self.text("#figures dt")[0])
        self.show("stays")
        self.assertIn("submission is not allowed", self.text("#panel-stays [data-label=Why]")[0])

    def test_what_stays_is_gone_or_belongs_to_the_log(self):
        self.open()
        self.show("stays")
        self.assertEqual(self.keys("stays")[:2], ["off", "unlisted"])
        reasons = self.text("#panel-stays [data-label=Why]")
        for reason, part in zip(reasons, ("group that is not in force", "does not list it")):
            self.assertIn(part, reason)
        self.show("gone")
        self.assertEqual(self.keys("gone"), ["gone"])
        self.show("about")
        info = self.device.info(self.device.log_files()[-1])
        about = "\n".join(self.text("#panel-about"))
        for part in ("Language", "Tasking", self.device.logs()[-1]["TBWhitelistDigest"], info.get("DevicePseudonym", "none")):
            self.assertIn(part, about)
        self.show("stop")
        self.assertIn("tallyctl prefs set DiagnosticSubmissionEnabled false --domain vellum.tallyd", self.text("#panel-stop code"))

    def test_the_log_that_would_go_next(self):
        self.open(log=0)
        self.assertIn("not over", self.text("#notes")[0])
        self.assertEqual(self.keys(), ["exact"])
        forbidden = Device()
        self.addCleanup(forbidden.remove)
        forbidden.fill()
        forbidden.set_preferences("vellum.tallyd", DiagnosticSubmissionEnabled=False)
        empty = Device()
        self.addCleanup(empty.remove)
        for device, note, count in [(empty, "whitelist cannot be used", "0 keys"), (forbidden, "not allowed", "1 key")]:
            self.open(log=0, page=self.write(device=device))
            self.assertIn(note, self.text("#notes")[0])
            self.assertEqual(self.text("#count"), [count])

    def test_another_whitelist_explains_nothing(self):
        other = plistlib.loads((self.device.root / WHITELIST).read_bytes())
        self.addCleanup(self.device.whitelist, **other)
        self.device.whitelist(Main=group({"kept": {"bucket_interval": 1000}}))
        self.open(page=self.write("other.html"))
        self.assertIn("another whitelist", self.text("#notes")[0])
        shown = "\n".join(self.row("kept"))
        self.assertIn("not known", shown)
        self.assertNotIn("prefs set", shown)

    def test_search_folding_and_views_by_keyboard(self):
        driven = self.open()
        driven.press("/", *"MS kep")
        driven.wait("document.getElementById('count').textContent.includes(' of ')")
        self.assertEqual((self.keys(), self.text("#count")), (["kept"], ["1 of 5 keys"]))
        self.assertEqual(driven.run("return document.getElementById('count').getAttribute('aria-live');"), "polite")
        driven.press(*TAB * 4, ENTER)  # past both selections and the panel
        self.assertEqual(driven.run("return [document.activeElement.innerText, document.activeElement.ariaExpanded,"
                                    "document.querySelectorAll('tr.details').length];"), ["kept", "true", 1])
        driven.press(ENTER)
        self.assertEqual(driven.run("return document.querySelectorAll('tr.details').length;"), 0)
        driven.run("document.getElementById('tab-leaves').focus();")
        driven.press(RIGHT)
        self.assertEqual(driven.run("return [document.activeElement.id, document.getElementById('panel-stays').hidden];"),
                         ["tab-stays", False])
        self.search("nothing has this")
        self.assertRegex(self.text("#count")[0], "^0 of . keys$")
        self.assertIn("Nothing matches", self.text("#panel-stays .empty")[0])

    def test_nothing_becomes_markup_and_nothing_is_asked_for(self):
        driven = self.open()
        self.row("</script>")
        self.assertEqual(driven.run("""return [document.querySelectorAll("img, iframe, b, link").length,
            performance.getEntriesByType("resource").length];"""), [0, 0])
        # The policy forbids what the page does not do.
        blocked = driven.run("""return new Promise((done) => {
            addEventListener("securitypolicyviolation", (event) => done(event.effectiveDirective));
            document.head.append(Object.assign(document.createElement("script"), { textContent: "document.title = 'x'" })); });""")
        self.assertEqual((blocked, driven.run("return document.title;")), ("script-src-elem", "What leaves this device"))
        # The source, too: nothing is outside of the data, and the data cannot end their element.
        source = self.page.read_text()
        self.assertNotIn("onerror", re.sub(r'<script type="application/json".*?</script>', "", source, flags=re.S))
        self.assertNotIn("\u2028", source)

    def test_contrast_labels_and_widths_in_both_themes(self):
        if not AXE.exists():
            self.skipTest("npm's axe-core is not installed")
        for width, scheme in [(360, "dark"), (768, "light"), (1600, "dark"), (1600, "light")]:
            driven = self.open(width=width, height=900, scheme=scheme, mobile=width < 400)
            driven.run(AXE.read_text())
            for view in ("leaves", "stays", "about", "stop"):
                self.show(view)
                if view == "leaves":
                    driven.run("for (const fold of document.querySelectorAll('button.fold')) fold.click();")
                driven.settle()
                faults = driven.run("""return axe.run(document, { runOnly: ["wcag2a", "wcag2aa", "wcag21a", "wcag21aa",
                    "wcag22aa", "best-practice"] }).then((found) => found.violations.map((one) =>
                    `${one.id}: ${one.nodes[0].html} ${one.nodes[0].failureSummary}`));""")
                self.assertEqual(faults, [], (width, scheme, view))
                self.assertLessEqual(driven.run("return document.documentElement.scrollWidth - innerWidth;"), 0, (width, view))

    def test_the_theme_follows_the_system_or_the_choice(self):
        ground = "return getComputedStyle(document.body).backgroundColor;"
        driven = self.open(scheme="light")
        light = driven.run(ground)
        choose = "const theme = document.getElementById('theme'); theme.value = arguments[0]; theme.dispatchEvent(new Event('change'));"
        driven.run(choose, "dark")
        dark = driven.run(ground)
        self.assertNotEqual(light, dark)
        # A browser takes its time to tell its next process what the last one stored.
        again = (self.open(scheme="light").run(ground) for _ in range(100))
        self.assertIn(dark, again, "the choice stays")
        driven.run(choose, "")
        self.assertEqual(self.open(scheme="dark").run(ground), dark)

    def test_a_hundred_thousand_keys_are_made_as_needed(self):
        device = Device()
        self.addCleanup(device.remove)
        device.whitelist(G=group(scalar_prefixes={"k": {}}))
        device.store([(f"k{number}", TODAY - 1, number) for number in range(MANY)])
        driven = self.open(log=0, page=self.write(device=device))
        self.assertEqual(self.text("#count"), ["100,000 keys"])
        self.assertLess(driven.run("return document.querySelectorAll('.fold').length;"), 300)
        driven.run("scrollTo(0, document.body.scrollHeight);")
        driven.wait("document.querySelector('#panel-leaves tbody:last-of-type .key')")
        self.assertEqual(self.keys()[-1], "k99999")
        self.search("k5000")
        self.assertEqual(self.keys(), ["k5000", *(f"k5000{digit}" for digit in range(10))])

    def test_paper_has_every_view(self):
        self.open()
        self.search("")
        printed = base64.b64decode(self.browser.command("print", background=True))
        self.assertTrue(printed.startswith(b"%PDF"))
        # What is laid out for paper: all views, and what was folded.
        self.browser.run("dispatchEvent(new Event('beforeprint'));")
        self.assertEqual([self.browser.run(f"return document.getElementById('panel-{view}').hidden;") for view in
                          ("leaves", "stays", "gone", "about", "stop")], [False] * 5)
        self.assertEqual(len(self.text("tr.details")), 5)
        self.browser.run("dispatchEvent(new Event('afterprint'));")
        self.assertEqual(len(self.text("tr.details")), 0)

    def test_the_file_is_private_and_replaced_as_a_whole(self):
        self.assertEqual(stat.S_IMODE(self.page.stat().st_mode), 0o600)
        target = self.device.root / "target"
        target.write_text("mine")
        link = self.device.root / "link.html"
        link.symlink_to(target)
        for path in (link, self.device.root, self.device.root / "nowhere/page.html"):
            self.device.tool("report", "page", "-o", str(path), status=1)
        self.assertEqual(target.read_text(), "mine")
        self.assertEqual(os.path.islink(link), True)
        printed = self.device.tool("report", "page", "--days", "1", "-o", "-", day=TODAY)
        self.assertEqual(re.findall('id="(log-.)"', printed), ["log-0", "log-1"])
        self.assertIn("tallyctl report show", re.search("<noscript>.*</noscript>", printed, re.S).group())


if __name__ == "__main__":
    main_with_optional_clients()
