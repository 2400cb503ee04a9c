"""Questions find what was simulated, in logs that the daily job made."""
import datetime
import json
import pathlib
import shutil
import subprocess
import tempfile
import unittest

import fleet
from fleet import Answer, ask
from device import BIN
from installed import TOP, main_with_optional_clients

DEVICES, DAYS = 120, 24
FEW = 3  # devices, of which answers about a fleet this small may still tell


def date_of(day):
    return datetime.date(1970, 1, 1) + datetime.timedelta(day)


@unittest.skipUnless((BIN / "fleet_simulation").exists(), "built without benchmarks")
@unittest.skipUnless(fleet.HAS_DUCKDB, "npm's @duckdb/node-api is not installed")
class Demo(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-demo-"))
        cls.addClassCleanup(shutil.rmtree, folder, ignore_errors=True)
        cls.output = folder / "demo"
        cls.said = subprocess.run(
            [TOP / "scripts/fleet-demo", "--devices", str(DEVICES), "--days", str(DAYS), "--output", cls.output],
            check=True, capture_output=True, text=True, timeout=280).stdout
        cls.truths = json.loads((cls.output / "truths.json").read_text())
        # The same tool with another K.
        shutil.copytree(TOP / "fleet", folder / "fleet")
        (folder / "fleet/settings.json").write_text(json.dumps({"K": FEW}))
        cls.tool, fleet.TOOL = fleet.TOOL, folder / "fleet/tallyfleet.mjs"
        cls.addClassCleanup(setattr, fleet, "TOOL", cls.tool)

    def ask(self, question, **parameters):
        return ask(question, data=self.output / "data", **parameters)

    def test_a_regression_of_few_devices_is_found_and_bounded(self):
        wakeups = self.truths["wakeups"]
        answer = self.ask("regression", key=wakeups["key"])
        tail, paired, typical = (answer.only(test=name) for name in ("tail", "paired", "typical"))
        self.assertEqual((tail["baseline"], tail["candidate"]),
                         (self.truths["old_version"], self.truths["new_version"]))
        share = wakeups["affected_devices"] / self.truths["updated_devices"]
        self.assertGreater(paired["difference"], 0)
        self.assertLess(tail["low"], share)
        self.assertGreater(tail["high"], share)
        self.assertGreater(tail["difference"], 0)
        # Most devices wake no more often than before.
        self.assertFalse(typical["found"])
        self.assertLess(typical["low"], 0)
        self.assertGreater(typical["high"], 0)

    def test_wear_is_foreseen(self):
        wear = self.truths["wear"]
        answer = self.ask("wear", key=wear["key"])
        first = answer.only(what="reached", share=wear["share"])
        last = self.truths["first_day"] + self.truths["days"]
        error = (datetime.date.fromisoformat(first["date"]) - date_of(wear["day"])).days
        self.assertLess(abs(error), 0.2 * (wear["day"] - last))

    def test_what_stopped_and_what_was_lost_is_named(self):
        keys = {row["key"]: row for row in self.ask("silence").rows}
        self.assertEqual(list(keys)[0], self.truths["stopped_key"])
        self.assertAlmostEqual(keys[self.truths["stopped_key"]]["share"], self.truths["updated_devices"] / DEVICES, delta=0.1)
        whole = self.ask("coverage").only(date=None, version=None)
        for column, truth in (("lost", "lost_logs"), ("duplicates", "repeated_logs")):
            self.assertAlmostEqual(whole[column], self.truths[truth], delta=FEW, msg=column)

    def test_the_page_stands_alone_and_the_answers_keep_k(self):
        page = (self.output / "fleet.html").read_text()
        self.assertNotRegex(page, r"<(script|link|img|iframe)|https?:|url\(|@import")
        self.assertGreaterEqual(page.count("<svg"), 5)
        self.assertIn(self.truths["stopped_key"], self.said)
        told = Answer((self.output / "answers/regression.json").read_text())
        self.assertEqual((told.all["k"], told.only(test="paired")["difference"]), (fleet.K, None))


if __name__ == "__main__":
    main_with_optional_clients()
