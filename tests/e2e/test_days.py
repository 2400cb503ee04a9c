"""Days of the real programs: modes and days, the log read back by another reader, rivals and signals."""
import bisect
import datetime
import fcntl
import hashlib
import json
import plistlib
import random
import shutil
import signal
import subprocess
import time
import unittest

from device import BIN, DeviceTest, LAST_DAY, PREFERENCES, PROGRAM_DOMAIN, TODAY, WHITELIST, checked, group, parse_messages, texts

YESTERDAY = TODAY - 1
UNCHANGED = "Day unchanged since last run"
RECORD = ("TaskingID", "TaskingOS", "TaskingDigest", "TaskingPayload", "TaskingUnfinished")


def summary(samples):
    mean = squares = 0.0
    for count, sample in enumerate(samples, 1):
        delta = sample - mean
        mean += delta / count
        squares += delta * (sample - mean)
    return [min(samples), max(samples), mean, squares, len(samples)]


def histogram(samples, bounds):
    edges = ["-inf", *map(str, bounds), "inf"]
    labels = [f"({low}, {high}]" for low, high in zip(edges, edges[1:])]
    labels[-1] = labels[-1].replace("]", ")")
    buckets = [labels[bisect.bisect_left(bounds, sample)] for sample in samples]
    return {label: buckets.count(label) for label in buckets}


def blocks_termination(pid):
    with open(f"/proc/{pid}/status", encoding="ascii") as status:
        blocked = status.read().partition("SigBlk:")[2].split()[0]
    return int(blocked, 16) >> (signal.SIGTERM - 1) & 1


class Days(DeviceTest):
    def test_switches(self):
        device, days = self.simple(), []
        whitelist = (device.root / WHITELIST).rename(device.root / "later")
        messages = device.run("-d")
        self.assertEqual(texts(messages, "error"), ["Couldn't load whitelist"])
        self.assertIn(f"no whitelist is installed yet, so day {YESTERDAY} stays unprocessed until there is one",
                      texts(messages, "default"))
        whitelist.rename(device.root / WHITELIST)
        for arguments, logged, between in ((["-t", "-d"], [TODAY], f"daily tasks for day {TODAY}"),
                                           (["-d"], [YESTERDAY], f"daily tasks for day {YESTERDAY}"),
                                           (["-d"], [], UNCHANGED)):
            messages = texts(device.run(*arguments), "default")
            self.assertEqual(messages, ["tallyrun started", between, "tallyrun ended"])
            days += logged
            self.assertEqual(self.logged_days(device), days)
            self.assertEqual(device.preferences().get(LAST_DAY), YESTERDAY if YESTERDAY in days else None)

    def test_only_a_finished_day_needs_no_module(self):
        device = self.simple()
        device.run("-d")
        alone = device.root / "programs/tallyrun"
        alone.parent.mkdir()
        shutil.copy(BIN / "tallyrun", alone)
        missing = f"nothing is done: cannot examine {device.root}/lib/tallyrun/tallyrun-day.so: No such file or directory"
        lock = open(device.root / "var/mobile/Library/Tallybook/tallyrun.lock", "r+b")
        self.addCleanup(lock.close)
        damaged = device.root / PREFERENCES / f"{PROGRAM_DOMAIN}.plist"
        for arguments, day, prepare, lines in (
                (["-d"], TODAY, lambda: None, ["tallyrun started", UNCHANGED, "tallyrun ended"]),
                (["-f"], TODAY, lambda: None, [missing]),
                (["-d"], TODAY + 1, lambda: None, [missing]),
                (["-d"], TODAY, lambda: fcntl.flock(lock, fcntl.LOCK_EX), [missing]),
                (["-d"], TODAY, lambda: fcntl.flock(lock, fcntl.LOCK_UN) or damaged.write_text("damaged"), [missing])):
            prepare()
            result = subprocess.run([alone, *arguments], capture_output=True, timeout=60, env=device.environment(day))
            self.assertEqual(([text for _, text in parse_messages(result.stderr)], result.returncode),
                             (lines, 127 if lines == [missing] else 0))
        self.assertEqual(damaged.read_text(), "damaged")  # its repair is the module's, with a line

    def test_a_wrong_clock_costs_no_day_and_no_row(self):
        for name, wrong in {"a week ten years ahead": range(TODAY + 3650, TODAY + 3657),
                            "a week of boots in 1970": [0, 0, 0, 1, 2, 0, 3]}.items():
            with self.subTest(name):
                device = self.fresh()
                device.root = device.root / "a device's"  # for the quotes in the repair
                device.describe()
                device.whitelist(G=group({"a": {}}))
                device.store([("a", day, day) for day in range(TODAY - 29, TODAY + 1)])
                device.run("-d")
                for day in wrong:
                    device.run("-d", day=day)
                    device.store([("a", day, day)])
                device.store([("a", TODAY + 1, TODAY + 1)])
                ahead = max(wrong) > TODAY
                messages = texts(device.run("-d", day=TODAY + 2), "error")
                self.assertEqual(sum("counts as processed" in text for text in messages), ahead)
                findings = json.loads(device.tool("doctor", "--json", status=None, day=TODAY + 2))
                repairs = [line["repair"] for line in findings if "repair" in line]
                self.assertEqual(len(repairs), ahead)
                for repair in repairs:
                    checked("/bin/sh", "-c", repair, PATH=str(BIN))
                    device.run("-d", day=TODAY + 2)
                self.assertLessEqual({YESTERDAY, TODAY + 1}, set(self.logged_days(device)))
                kept = device.tool("store", "dump")
                self.assertEqual([day for day in range(TODAY - 27, TODAY + 2) if f"a,{day},,{day}" not in kept], [])

    def test_the_log_is_what_another_reader_computes(self):
        device, source = self.device, random.Random(1)
        bounds = [[], [10], [-5, 0, 2.5, 10, 1000]]
        samples = {f"d.{i}": [round(source.gauss(5, 20), 3) for _ in range(i * i * 90 + 1)] for i in range(9)}
        device.whitelist(G=group(
            {"a": {"sig_fig": 1}, "caf\u00e9 <&> \U0001f600": {}, "vellum.dockyard.numAllInstalledApps": {}},
            {key: {"intervals": bounds[i % 3]} for i, key in enumerate(samples)}))
        device.store([("a", YESTERDAY, 1550), ("caf\u00e9 <&> \U0001f600", YESTERDAY, -3),
                      ("secret", YESTERDAY, 1), ("a", TODAY, 5)],
                     [("secret", YESTERDAY, [1.0]), *((key, YESTERDAY, s) for key, s in samples.items())])
        device.describe(OSVersion="5.1", Applications=["User", "System"], RegionCode="CH",
                        PreferredLanguages=["de-CH"], SystemLanguages=["en", "de"])
        payload = [{"Domain": "vellum.da", "User": "mobile", "Key": "G", "Value": True}]
        device.set_preferences(TaskingID="T-1", TaskingDigest=b"\x01\x02", TaskingPayload=payload)
        messages = device.run("-f")
        log = device.log()
        noon = datetime.datetime(2026, 3, 2, 12, 0)
        self.assertLess(abs(log.pop("TBLogCreationDate") - noon), datetime.timedelta(minutes=5))
        self.assertEqual(log, {
            "TBCrashLogVersion": 1, "TBStartDate": datetime.datetime(2026, 3, 1),
            "TBMetadata": {"TBUserInterfaceLanguage": "de", "TBPreferredUserInterfaceLanguage": "de-CH",
                           "TBUserSetRegionFormat": "CH"},
            "TBScalars": {"a": 2000, "caf\u00e9 <&> \U0001f600": -3, "vellum.dockyard.numAllInstalledApps": 2},
            "TBDistributions": {key: summary(some) for key, some in samples.items()},
            "TBDistributionsHistogram": {key: histogram(some, bounds[i % 3])
                                         for i, (key, some) in enumerate(samples.items())},
            "TBTasking": payload, "TBTaskID": "T-1", "TBTaskDigest": "<0102>",
            "TBWhitelistDigest": hashlib.md5((device.root / WHITELIST).read_bytes()).hexdigest()})
        self.assertEqual(texts(messages, "info"), [f"writing tallyd log. yesterday={YESTERDAY}"])

    def test_tasking_reaches_every_user_and_the_next_log(self):
        device = self.simple()
        files = {"mobile": f"{PREFERENCES}/dom.plist", "__sysmetra__": "Library/Preferences/dom.plist",
                 "guest": "var/guest/Library/Preferences/dom.plist"}
        for build, identifier in (("16S46", "A"), ("16S50", "A"), ("16S50", "B")):
            device.describe(SystemVersion={"ProductBuildVersion": build})
            payload = [{"User": user, "Domain": "dom", "Key": identifier, "Value": 0} for user in files]
            schedule = {"TaskingID": identifier, "TaskingDigest": b"\1\2", "TaskingPayload": payload}
            device.write("Library/Preferences/vellum.Ferryman.plist",
                         plistlib.dumps({"ScheduledTasking": schedule}, fmt=plistlib.FMT_BINARY))
            again = "Tasking update (A -> A, 16S46 -> 16S50)" in texts(device.run("-f"))
            self.assertEqual(again, (build, identifier) == ("16S50", "A"))
            self.assertEqual([plistlib.loads((device.root / file).read_bytes()) for file in files.values()],
                             [{identifier: 0}] * 3)
            self.assertEqual([device.preferences().get(key) for key in RECORD],
                             [identifier, build, b"\1\2", payload, None])
        # A log carries what was in force when it was written.
        self.assertEqual([log["TBTaskID"] for log in device.logs()], ["(no tasking id)", "A", "A"])

    def test_four_at_once_do_one_day(self):
        device = self.simple()
        runs = [device.start("-d") for _ in range(4)]
        endings = [texts(parse_messages(run.communicate(timeout=120)[1])) for run in runs]
        self.assertEqual(sum(UNCHANGED in ending for ending in endings), 3)
        self.assertEqual(self.logged_days(device), [YESTERDAY])

    def test_a_closed_pipe_and_no_space_end_nothing(self):
        for limit in ([], ["prlimit", "--fsize=4096"]):
            device = self.simple()
            with subprocess.Popen([*limit, *device.command("-d")], stderr=subprocess.PIPE,
                                  env=device.environment(TODAY)) as run:
                if limit:
                    self.assertTrue(texts(parse_messages(run.stderr.read()), "error"))
                run.stderr.close()
                self.assertEqual(run.wait(timeout=120), 0)
            self.assertEqual(texts(device.run("-d", day=TODAY + 1), "error"), [])
            self.assertIn(TODAY, self.logged_days(device))

    def test_a_terminated_wait_ends_in_order(self):
        run = self.simple().start(day=None)
        end = time.monotonic() + 60
        while not blocks_termination(run.pid):  # as it does once it waits in its event loop
            self.assertLess(time.monotonic(), end)
            time.sleep(0.02)
        run.send_signal(signal.SIGTERM)
        messages = parse_messages(run.communicate(timeout=120)[1])
        self.assertEqual(run.returncode, 0)
        self.assertEqual(texts(messages, "default"), ["tallyrun started", "tallyrun ended"])

    def test_the_tools_output_may_be_closed_and_its_version_is_the_jobs(self):
        for stream in (">&-", ">/dev/full"):
            result = subprocess.run(["bash", "-c", f"'{BIN}/tallyctl' --help {stream}"], timeout=60,
                                    capture_output=True, env=self.device.environment())
            self.assertEqual(result.returncode, 1)
            self.assertIn(b"cannot write to standard output", result.stderr)
        tool, job = (checked(BIN / name, "--version") for name in ("tallyctl", "tallyrun"))
        self.assertEqual(tool.split()[1:], job.split()[1:])


if __name__ == "__main__":
    unittest.main()
