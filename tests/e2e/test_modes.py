"""Run modes, days and switches of the real program."""
import json
import os
import subprocess
import unittest

from device import BIN, DeviceTest, LAST_DAY, TODAY, WHITELIST, group, texts

YESTERDAY = TODAY - 1
UNCHANGED = "Day unchanged since last run"


class Modes(DeviceTest):
    def test_switches(self):
        day_task = f"daily tasks for day {YESTERDAY}"
        cases = [  # arguments, stored day, days logged, stored afterwards, messages in between
            (["-d"], None, [YESTERDAY], YESTERDAY, [day_task]),
            (["-d"], YESTERDAY, [], YESTERDAY, [UNCHANGED]),
            (["-d"], TODAY + 3, [], TODAY + 3, [UNCHANGED]),
            (["-d"], TODAY - 4, [YESTERDAY], YESTERDAY, [day_task]),
            (["-f"], YESTERDAY, [YESTERDAY], YESTERDAY, [day_task]),
            (["-f"], None, [YESTERDAY], None, [day_task]),
            (["-t", "-d"], None, [TODAY], None, [f"daily tasks for day {TODAY}"]),
            (["-x"], None, [], None, ["Unknown arg: -x"]),
            (["--force", "-f"], None, [], None, ["Unknown arg: --force"]),
        ]
        for arguments, stored, days, stored_after, between in cases:
            with self.subTest(arguments=arguments, stored=stored):
                device = self.simple()
                if stored is not None:
                    device.set_preferences(**{LAST_DAY: stored})
                messages = texts(device.run(*arguments), "default")
                self.assertEqual(messages, ["tallyrun started", *between, "tallyrun ended"])
                self.assertEqual(self.logged_days(device), days)
                self.assertEqual(device.preferences().get(LAST_DAY), stored_after)

    def test_a_week_of_days(self):
        device = self.simple()
        # Two runs on the first day, a missed day, then the clock goes back.
        for day in (TODAY, TODAY, TODAY + 2, TODAY + 1):
            device.run("-d", day=day)
        self.assertEqual(self.logged_days(device), [TODAY - 1, TODAY + 1])
        self.assertEqual(device.preferences()[LAST_DAY], TODAY + 1)

    def test_a_wrong_clock_costs_no_day_and_no_row(self):
        cases = {  # the days of the runs under the wrong clock
            "one run ten years ahead": [TODAY + 3650],
            "a week ten years ahead": range(TODAY + 3650, TODAY + 3657),
            "a week of boots in 1970": [0, 0, 0, 1, 2, 0, 3],
        }
        first = TODAY - 29
        for name, wrong in cases.items():
            with self.subTest(name):
                device = self.fresh()
                device.root = device.root / "a device's"  # for the quotes in the repair
                device.describe()
                device.whitelist(G=group({"a": {}}))
                device.store([("a", day, day) for day in range(first, TODAY + 1)])
                device.run("-d")
                for day in wrong:
                    device.run("-d", day=day)
                    device.store([("a", day, day)])
                device.store([("a", TODAY + 1, TODAY + 1)])
                ahead = max(wrong) > TODAY
                messages = device.run("-d", day=TODAY + 2)
                stuck = [text for text in texts(messages, "error") if "counts as processed" in text]
                self.assertEqual(len(stuck), ahead)
                findings = json.loads(device.tool("doctor", "--json", status=None, day=TODAY + 2))
                repairs = [line["repair"] for line in findings if "repair" in line]
                self.assertEqual(len(repairs), ahead)
                for repair in repairs:
                    subprocess.run(["/bin/sh", "-c", repair], check=True,
                                   stdout=subprocess.DEVNULL, env=dict(os.environ, PATH=BIN))
                    device.run("-d", day=TODAY + 2)
                self.assertLessEqual({YESTERDAY, TODAY + 1}, set(self.logged_days(device)))
                rows = device.tool("store", "dump").splitlines()
                kept = {int(row.split(",")[2]) for row in rows if row.startswith("scalar,a,")}
                self.assertLessEqual(set(range(first + 2, TODAY + 2)), kept)

    def test_the_day_changes_at_midnight_utc(self):
        device = self.simple()
        for seconds in (86399, 86400):
            device.run("-f", seconds=seconds)
        self.assertEqual(self.logged_days(device), [YESTERDAY, TODAY])

    def test_scheduled_mode_without_messages_processes_nothing(self):
        device = self.simple()
        messages = device.run()
        self.assertEqual(texts(messages, "default"), ["tallyrun started", "tallyrun ended"])
        self.assertEqual(device.log_files(), [])
        self.assertEqual(device.preferences(), {})

    def test_no_log_without_consent_or_data(self):
        def unwanted(device):
            device.describe(DiagnosticSubmissionEnabled=False)

        def refused(device):
            device.set_preferences("vellum.tallyd", DiagnosticSubmissionEnabled=False)

        def nothing_listed(device):
            device.whitelist(G=group({"b": {}}))

        def no_whitelist(device):
            (device.root / WHITELIST).unlink()

        def tasked_away(device):
            device.set_preferences("vellum.da", G=False)

        for prepare in (unwanted, refused, nothing_listed, no_whitelist, tasked_away):
            with self.subTest(prepare.__name__):
                device = self.simple()
                prepare(device)
                messages = device.run("-d")
                self.assertEqual(device.log_files(), [])
                waits = prepare is no_whitelist
                self.assertEqual(device.preferences(), {} if waits else {LAST_DAY: YESTERDAY})
                wanted = {"no_whitelist": ["Couldn't load whitelist"]}.get(prepare.__name__, [])
                self.assertEqual(texts(messages, "error"), wanted)
                if prepare is tasked_away:
                    self.assertIn("keyGroup G is disabled by tasking", texts(messages, "default"))
                if waits:  # the whitelist that arrives later finds the day still to be done
                    self.assertIn(f"no whitelist is installed yet, so day {YESTERDAY} stays unprocessed "
                                  "until there is one", texts(messages, "default"))
                    device.whitelist(G=group({"a": {}}))
                    device.run("-d")
                    self.assertEqual(self.logged_days(device), [YESTERDAY])
                    self.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)

    def test_internal_devices_report_every_key(self):
        device = self.simple()
        device.describe(DeviceAnswers={"InternalBuild": True, "ConfigNumber": b"R7\0"},
                        HasInternalDiagnostics=True)
        device.whitelist(InternalTesting=group({"b": {}}))
        device.run("-f")
        self.assertEqual(self.logged_days(device), [YESTERDAY])
        self.assertEqual(device.info(device.log_files()[0])["Options"]["ConfigNumber"], "R7")


if __name__ == "__main__":
    unittest.main()
