"""Damaged files, full folders, kills and rivals: a clear line, nothing lost, nothing half-written."""
import plistlib
import random
import signal
import sqlite3
import subprocess
import time
import unittest

from device import (DeviceTest, LAST_DAY, PREFERENCES, PROGRAM_DOMAIN, SPOOL, STORE, TODAY,
                    WHITELIST, group, parse_messages, texts)

YESTERDAY = TODAY - 1
HEAD = b'<?xml version="1.0"?><plist version="1.0">'


def blocks_termination(pid):
    with open(f"/proc/{pid}/status", encoding="ascii") as status:
        blocked = status.read().partition("SigBlk:")[2].split()[0]
    return int(blocked, 16) >> (signal.SIGTERM - 1) & 1


def bplist_with_cycle():
    """An array that holds itself."""
    objects = b"\xa1\x00"
    offset = 8 + len(objects)
    return (b"bplist00" + objects + b"\x08" + bytes(6) + b"\x01\x01" + (1).to_bytes(8, "big") +
            bytes(8) + offset.to_bytes(8, "big"))


HOSTILE_WHITELISTS = {
    "a million nested arrays": HEAD + b"<array>" * 1_000_000,
    "a million nested dictionaries": HEAD + b"<dict><key>a</key>" * 1_000_000,
    "a cycle": bplist_with_cycle(),
    "an entity that grows": b'<?xml version="1.0"?><!DOCTYPE plist [<!ENTITY a "aaaaaaaa"><!ENTITY b '
                            b'"&a;&a;&a;&a;">]><plist><dict><key>&b;</key><dict/></dict></plist>',
    "an external entity": b'<!DOCTYPE plist [<!ENTITY x SYSTEM "file:///etc/passwd">]>'
                          b"<plist><dict><key>&x;</key><dict/></dict></plist>",
    "cut short": plistlib.dumps({"G": group({"a": {}})})[:-40],
    "a binary list cut short": plistlib.dumps({"G": group({"a": {}})}, fmt=plistlib.FMT_BINARY)[:-9],
    "empty": b"", "zeros": bytes(1_000_000), "no list": b"\x7fELF" + bytes(64),
    "an open comment": HEAD + b"<!-- " * 200_000,
    "a root that is a string": HEAD + b"<string>x</string></plist>",
}


class Inputs(DeviceTest):
    def check_refused(self, device, text):
        messages = device.run("-d")
        self.assertEqual(device.log_files(), [])
        errors = texts(messages, "error")
        self.assertEqual(len(errors), 1, errors)
        self.assertTrue(errors[0].startswith(text), errors)
        self.assertEqual(device.preferences(), {LAST_DAY: YESTERDAY})

    def test_hostile_whitelists_admit_nothing(self):
        device = self.simple()
        for name, content in HOSTILE_WHITELISTS.items():
            with self.subTest(name):
                (device.root / PREFERENCES / f"{PROGRAM_DOMAIN}.plist").unlink(missing_ok=True)
                device.write(WHITELIST, content)
                self.check_refused(device, "Couldn't parse the contents of the config file. Error: ")

    def test_whitelists_that_cannot_be_read(self):
        def folder(path):
            path.unlink()
            path.mkdir()

        def huge(path):
            with path.open("wb") as file:
                file.truncate(1 << 30)

        for spoil in (folder, huge):
            with self.subTest(spoil.__name__):
                device = self.simple()
                spoil(device.root / WHITELIST)
                self.check_refused(device, "Couldn't load whitelist")

    def test_a_missing_store_is_a_fresh_device(self):
        device = self.simple()
        for path in (device.root / STORE).parent.glob("TBDataStore*"):
            path.unlink()
        messages = device.run("-d")
        self.assertEqual(texts(messages, "error"), [])
        self.assertEqual(device.log_files(), [])
        # What is there now is what the run swept into the day in progress.
        self.assertIn(f",vellum.dockyard.DiskUsageUserTotalBlocks,{TODAY},",
                      device.tool("store", "dump"))

    def test_stores_that_cannot_be_used_are_left_as_they_are(self):
        def no_database(path):
            path.write_bytes(b"this is no database, whatever its name says " * 200)

        def newer(path):
            with sqlite3.connect(path) as database:
                database.execute("PRAGMA user_version = 99")
            database.close()

        def foreign(path):
            path.unlink()
            with sqlite3.connect(path) as database:
                database.execute("CREATE TABLE notes(text)")
            database.close()

        for spoil in (no_database, newer, foreign):
            with self.subTest(spoil.__name__):
                device = self.simple()
                spoil(device.root / STORE)
                before = (device.root / STORE).read_bytes()
                messages = device.run("-d")
                self.assertEqual(device.log_files(), [])
                self.assertTrue(any("TBDataStore" in text for text in texts(messages, "error")))
                self.assertEqual((device.root / STORE).read_bytes(), before)
                self.assertEqual(device.preferences(), {LAST_DAY: YESTERDAY})

    def test_a_damaged_preference_file_is_set_aside(self):
        for content in (b"garbage", b"", plistlib.dumps(["no", "dictionary"]), HEAD + b"<dict><key>"):
            device = self.simple()
            device.write(f"{PREFERENCES}/{PROGRAM_DOMAIN}.plist", content)
            messages = device.run("-d")
            errors = texts(messages, "error")
            self.assertEqual(len(errors), 1, errors)
            self.assertIn(PROGRAM_DOMAIN, errors[0])
            self.assertEqual(self.logged_days(device), [YESTERDAY])
            self.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)
            aside, = (device.root / PREFERENCES).glob(f"{PROGRAM_DOMAIN}.plist.*")
            self.assertEqual(aside.read_bytes(), content)


class Spool(DeviceTest):
    def test_the_oldest_logs_go_first(self):
        device = self.simple()
        device.set_preferences(SpoolMaximumLogs=3)
        for day in range(TODAY - 3, TODAY + 2):
            device.run("-d", day=day)
        self.assertEqual(self.logged_days(device), [TODAY - 2, TODAY - 1, TODAY])
        # The clock is set back: what is newest is still what was written last.
        device.run("-f", day=TODAY - 3)
        self.assertEqual(self.logged_days(device), [TODAY - 1, TODAY, TODAY - 4])

    def test_a_spool_that_cannot_be_written_leaves_nothing_behind(self):
        device = self.simple()
        device.write(SPOOL, b"a file in the folder's place")
        messages = device.run("-d")
        self.assertIn("Failed to write tallyd log", texts(messages, "error"))
        self.assertEqual((device.root / SPOOL).read_bytes(), b"a file in the folder's place")
        self.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)

    def test_a_log_above_the_bound_is_refused_and_evicts_nothing(self):
        device = self.simple()
        device.run("-d", day=TODAY - 1)
        device.set_preferences(SpoolMaximumBytes=500)
        messages = device.run("-d")
        self.assertEqual(texts(messages, "error")[-1], "Failed to write tallyd log")
        self.assertEqual(self.logged_days(device), [TODAY - 2])
        self.assertEqual([path.name for path in (device.root / SPOOL).iterdir()
                          if "tmp" in path.name], [])


class Rivals(DeviceTest):
    def test_two_at_once_do_one_day(self):
        for _ in range(3):
            device = self.simple()
            device.whitelist(G=group(scalar_prefixes={"": {}}, distribution_prefixes={"": {}}))
            runs = [device.start("-d") for _ in range(4)]
            endings = [parse_messages(run.communicate(timeout=120)[1]) for run in runs]
            unchanged = [1 for messages in endings
                         if "Day unchanged since last run" in texts(messages)]
            self.assertEqual(len(unchanged), 3)
            self.assertEqual(self.logged_days(device), [YESTERDAY])

    def test_a_kill_at_any_moment_loses_nothing(self):
        source = random.Random(5)
        keys = {f"k{i:04}": i for i in range(3000)}
        device = self.device
        device.whitelist(G=group(scalar_prefixes={"k": {}}, distribution_prefixes={"d": {}}))
        device.store([(key, YESTERDAY, value) for key, value in keys.items()],
                     [("d", YESTERDAY, [float(i) for i in range(20000)])])
        started = time.monotonic()
        device.run("-f")
        whole = time.monotonic() - started
        for path in device.log_files():
            path.unlink()
        killed = 0
        for _ in range(60):
            (device.root / PREFERENCES / f"{PROGRAM_DOMAIN}.plist").unlink(missing_ok=True)
            run = device.start("-d")
            time.sleep(source.uniform(0, whole))
            run.send_signal(signal.SIGKILL)
            run.communicate()
            killed += run.returncode == -signal.SIGKILL
            self.check_whole(device, keys)
        self.assertGreater(killed, 10)
        for path in (device.root / SPOOL).glob("*.log"):
            path.unlink()
        (device.root / PREFERENCES / f"{PROGRAM_DOMAIN}.plist").unlink(missing_ok=True)
        device.run("-d")
        self.assertEqual(device.log()["TBScalars"], keys)
        self.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)
        left = {path.name for path in (device.root / SPOOL).iterdir() if path.suffix != ".lock"}
        self.assertEqual(len(left), 2, left)

    def check_whole(self, device, keys):
        for path in (device.root / PREFERENCES).glob("*.plist"):
            plistlib.loads(path.read_bytes())
        logs = device.logs()  # parses each
        for log in logs:
            self.assertEqual(log["TBScalars"], keys)
        if device.preferences().get(LAST_DAY) is not None:
            self.assertTrue(logs)
        with sqlite3.connect(device.root / STORE) as database:
            self.assertEqual(database.execute("PRAGMA integrity_check").fetchone(), ("ok",))
        database.close()

    def test_writes_that_fail_end_nothing(self):
        def limited(size):
            return lambda device: subprocess.Popen(
                ["prlimit", f"--fsize={size}", *device.command("-d")], stderr=subprocess.PIPE,
                env=device.environment(TODAY))

        def closed_pipe(device):
            run = device.start("-d")
            run.stderr.close()
            return run

        for name, start in {"a closed pipe": closed_pipe, "no bytes": limited(0),
                            "a page": limited(1 << 12), "some pages": limited(1 << 14)}.items():
            with self.subTest(name):
                device = self.simple()
                run = start(device)
                if not run.stderr.closed:
                    self.assertTrue(texts(parse_messages(run.stderr.read()), "error"))
                    run.stderr.close()
                self.assertEqual(run.wait(timeout=120), 0)
                messages = device.run("-d", day=TODAY + 1)
                self.assertEqual(texts(messages, "error"), [])
                self.assertIn(TODAY, self.logged_days(device))

    def test_a_terminated_wait_ends_in_order(self):
        device = self.simple()
        run = device.start(day=None)
        end = time.monotonic() + 60
        while not blocks_termination(run.pid):  # as it does once it waits in its event loop
            self.assertLess(time.monotonic(), end)
            time.sleep(0.02)
        run.send_signal(signal.SIGTERM)
        messages = parse_messages(run.communicate(timeout=120)[1])
        self.assertEqual(run.returncode, 0)
        self.assertEqual(texts(messages, "default"), ["tallyrun started", "tallyrun ended"])


if __name__ == "__main__":
    unittest.main()
