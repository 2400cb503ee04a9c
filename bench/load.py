"""A device far larger than any should be. TALLYRUN_LOAD is the share of the full size: 1 is a million
scalars, a hundred million samples, a million records, 200,000 channels and three years of logs."""
import contextlib
import csv
import io
import json
import multiprocessing
import os
import pathlib
import plistlib
import re
import signal
import sqlite3
import struct
import subprocess
import sys
import tempfile
import threading
import time
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[1] / "tests/e2e"))
from bus import BusDevice, NAME
from device import BIN, DeviceTest, SPOOL, STORE, TODAY, group, parse_messages, texts
from raw_peer import RawPeer, int64_fields

SHARE = float(os.environ.get("TALLYRUN_LOAD", "0.01"))
YESTERDAY = TODAY - 1
MIB = 1024  # of the kibibytes in which memory is counted
# What a sanitizer needs says nothing about the program.
MEMORY_COUNTS = b"__asan_init" not in (BIN / "tallyrun").read_bytes()
# Between the test and what it measures stands a small process, because a program's peak memory begins
# with that of the process which starts it.
LAUNCHER = """import os, sys
_, status, usage = os.wait4(os.posix_spawn(sys.argv[2], sys.argv[2:], os.environ), 0)
open(sys.argv[1], "w").write(str(usage.ru_maxrss))
sys.exit(os.waitstatus_to_exitcode(status))"""


def sized(full, least=1):
    return max(int(full * SHARE), least)


def scalar_key(i):
    return b"load.scalar.of.an.everyday.length.%06d" % i


class Run:
    """A program that ran to its end: what it wrote, how long it took, its peak memory in KiB."""

    def __init__(self, device, *command, stdin=(), day=None):
        usage = device.root / "usage"
        with tempfile.TemporaryFile() as out, tempfile.TemporaryFile() as errors:
            start = time.monotonic()
            process = subprocess.Popen([sys.executable, "-ISc", LAUNCHER, usage, *command],
                                       stdin=subprocess.PIPE, stdout=out, stderr=errors,
                                       env=dict(device.environment(day), TALLYRUN_LOG_LEVEL="info"))
            for piece in stdin:
                process.stdin.write(piece)
            process.communicate()
            self.seconds = time.monotonic() - start
            self.out, self.errors = (file.seek(0) or file.read() for file in (out, errors))
        assert process.returncode == 0, (command, self.errors[-2000:])
        self.memory = int(usage.read_text())

    def __str__(self):
        return f"{self.seconds:.1f} s, {self.memory / MIB:.0f} MiB"


def daily(device, argument, day=TODAY):
    run = Run(device, *device.command(argument), day=day)
    errors = texts(parse_messages(run.errors), "error")
    assert not errors, errors
    return run


def tool(device, *arguments, stdin=()):
    run = Run(device, BIN / "tallyctl", "--root", device.root, *arguments, stdin=stdin)
    assert arguments[0] == "nand" or not run.errors, run.errors[-2000:]
    return run


def rival(device):
    """Commits a thousand times a second until told to end, and opens the store anew now and then."""
    ended = []
    signal.signal(signal.SIGTERM, lambda *_: ended.append(True))
    count, start = 0, time.monotonic()
    while not ended:
        store = sqlite3.connect(device.root / STORE, timeout=60, isolation_level=None)
        store.execute("PRAGMA synchronous = NORMAL")
        for count in range(count + 1, count + 501):
            store.execute("BEGIN IMMEDIATE")
            store.execute("INSERT OR REPLACE INTO scalars VALUES (?, 'load.rival', ?)", (TODAY, count))
            store.execute("INSERT INTO arrivals VALUES (NULL, ?, 'load.rival', 1, 1, ?)",
                          (TODAY, struct.pack("<6BHId", 1, 0, 0, 0, 0, 0, 1, 0, count)))
            store.execute("COMMIT")
            time.sleep(max(0, start + count / 1000 - time.monotonic()))
        store.close()
    (device.root / "commits").write_text(f"{count} {count / (time.monotonic() - start):,.0f}")


def say(text):
    print("\n" + text, flush=True)


class Load(DeviceTest):
    # Keys take turns by a thousand samples, whose values are the key's number and three digits.
    KEYS, TURN = 100, 1000

    def large(self, **preferences):
        device = self.fresh()
        device.whitelist(G=group(scalar_prefixes={"load.": {}}, distribution_prefixes={"load.": {}}))
        device.set_preferences(SpoolMaximumBytes=1 << 32, **preferences)
        return device

    def rows(self, scalars, turns):
        for first in range(0, scalars, self.TURN):
            yield b"".join(b"scalar,%s,%d,,%d\n" % (scalar_key(i), YESTERDAY, i * 7)
                           for i in range(first, min(first + self.TURN, scalars)))
        turn = b"".join(b"distribution,load.d#,%d,%d,#%03d\n" % (YESTERDAY, i * 86, i * 617 % self.TURN)
                        for i in range(self.TURN))
        for _ in range(turns):
            for key in range(1, self.KEYS + 1):
                yield turn.replace(b"#", b"%d" % key)

    def check_log(self, device, scalars, turns):
        log = device.log()
        self.assertEqual({key: value for key, value in log["TBScalars"].items() if "load." in key},
                         {scalar_key(i).decode(): i * 7 for i in range(scalars)})
        self.assertEqual(len(log["TBDistributions"]), self.KEYS)
        deviations = turns * self.TURN * (self.TURN ** 2 - 1) / 12
        for key in range(1, self.KEYS + 1):
            least, most, mean, squares, count = log["TBDistributions"][f"load.d{key}"]
            base = key * self.TURN
            self.assertEqual((least, most, count), (base, base + self.TURN - 1, turns * self.TURN), key)
            self.assertAlmostEqual(mean, base + (self.TURN - 1) / 2, delta=1e-9 * base)
            self.assertAlmostEqual(squares, deviations, delta=1e-9 * deviations)

    def test_day(self):
        scalars, memory = sized(1_000_000), []
        for turns in (sized(100), sized(1000)):
            device = self.large()
            load = tool(device, "store", "import", "-", stdin=self.rows(scalars, turns))
            run = daily(device, "-f")
            self.check_log(device, scalars, turns)
            say(f"{scalars:,} scalars, {turns * self.KEYS * self.TURN:,} samples: "
                f"import {load}; daily run {run}")
            self.assertTrue(load.memory < 64 * MIB or not MEMORY_COUNTS)
            memory.append(run.memory)
            device.remove()
        # Samples of a few keys side by side take up to 1 MiB, whatever their number.
        self.assertTrue(memory[1] < memory[0] * 1.03 + 2.5 * MIB or not MEMORY_COUNTS,
                        "the daily run's memory grows with the samples")

    def test_statistics(self):
        rounds = sized(250_000)
        device = self.fresh()
        device.write("device/registry.plist", {"Entries": [{"Class": "SPXStorage", "UserClient": {
            "Methods": [{"Method": 8, "Selector": 13, "Data": "statistics.bin"}]}}]})
        # Of a counter the last record stands; what goes into a derived figure is added up.
        device.write("device/statistics.bin", struct.pack("<IIQ", 53, 1, 0x20004) + b"".join(
            struct.pack("<IIQIIQIIQQIIQ", 7, 1, i, 532, 1, 2 * i, 269, 2, i, 1, 0x1000000, 1, 5)
            for i in range(rounds)))
        run = tool(device, "nand", "info", "--json")
        info = json.loads(run.out)
        self.assertEqual([info["vellum.NANDInfo." + name] for name in
                          ("NumLogicalReads", "spareAvailablePercent", "NumMaintenanceRequests")],
                         [rounds - 1, 2 * (rounds - 1), rounds * (rounds - 1) // 2])
        say(f"{4 * rounds + 1:,} records: {run}")

    def test_channels(self):
        runs = []
        for part in (sized(1000), sized(10_000)):
            device, count, simple = self.large(), 20 * part, 1 | 0x100 << 16 | 1 << 32
            drivers = [range(first, first + part) for first in range(0, count, part)]
            device.write("device/registry.plist", {"Entries": [{"Class": "HwReportHub"}] + [
                {"Class": "Load", "Properties": {
                    "HwReportLegendPublic": True,
                    "HwReportLegend": [{"HwReportChannels":
                                        [[i, simple, f"channel {i}"] for i in ids]}],
                    "HwReportValues": [{"Channel": i, "Value": i * 3} for i in ids]}}
                for ids in drivers]})
            runs.append([tool(device, "channels", "list", "--json"),
                         tool(device, "channels", "sample", "--json"), daily(device, "-f")])
            listed, sampled, _ = (run.out for run in runs[-1])
            expected = {f"channel {i}": i * 3 for i in range(count)}
            self.assertEqual({channel["name"] for channel in json.loads(listed)}, set(expected))
            self.assertEqual({channel["name"]: channel["value"]
                              for channel in json.loads(sampled)["channels"]}, expected)
            swept = tool(device, "store", "dump", "--prefix", "vellum.hwreport.").out
            self.assertEqual(swept.count(b"\n"), count + 1)
            say("{:,} channels: list {}; sample {}; daily run {}".format(count, *runs[-1]))
        for less, more in zip(*runs):
            self.assertLess(more.memory, 12 * less.memory, "memory grows faster than the channels")

    def test_spool(self):
        days = sized(1096, 20)
        device = self.simple()
        device.run("-f")
        made = device.log_files()[0]
        body, info = made.read_bytes(), plistlib.dumps(device.info(made))
        for i in range(1, days + 1):
            day = time.strftime("%F", time.gmtime((YESTERDAY - days + i) * 86400)).encode()
            dated = re.sub(rb"(TBStartDate</key>\s*<date>)[^T]*", rb"\g<1>" + day, body)
            device.write(f"{SPOOL}/{i:010}-log-tallyd.log", dated)
            device.write(f"{SPOOL}/{i:010}-log-tallyd.info.plist", info)
        device.set_preferences(SpoolMaximumLogs=days)
        run = tool(device, "report", "list", "--json")
        self.assertEqual([(log["sequence"], log["day"]) for log in json.loads(run.out)],
                         [(i, YESTERDAY - days + i) for i in range(1, days + 1)])
        for day, kept in ((TODAY, days), (TODAY + 1, days // 2)):
            device.set_preferences(SpoolMaximumLogs=kept)
            evicting = daily(device, "-d", day=day)
            newest = days + 1 + day - TODAY
            self.assertEqual([int(path.name[:10]) for path in device.log_files()],
                             list(range(newest + 1 - kept, newest + 1)))
            self.assertEqual(len(list((device.root / SPOOL).glob("*.info.plist"))), kept)
        say(f"{days:,} logs: list {run}; daily run that removes half {evicting}")

    def test_rival(self):
        seconds, scalars, turns = 3 + 57 * SHARE, sized(20_000, 2000), sized(10, 3)
        device = self.large(SpoolMaximumLogs=1)
        tool(device, "store", "import", "-", stdin=self.rows(scalars, turns))
        tool(device, "store", "push", "load.rival", "0", "--day", str(YESTERDAY - 1))  # makes the table
        daily(device, "-f")

        def readings():
            return [re.findall(rb".*load\.[ds].*", tool(device, *read, "--day", str(YESTERDAY)).out)
                    for read in (("report", "preview"), ("store", "dump"), ("explain", scalar_key(42)),
                                 ("explain", "load.d1"))]

        expected = readings()
        other = multiprocessing.get_context("fork").Process(target=rival, args=(device,))
        other.start()
        end, runs = time.monotonic() + seconds, []
        try:
            while time.monotonic() < end:
                runs.append(daily(device, "-f"))
                self.check_log(device, scalars, turns)
                self.assertEqual(readings(), expected)
        finally:
            other.terminate()
            other.join()
        self.assertEqual(other.exitcode, 0)
        commits, rate = (device.root / "commits").read_text().split()
        dump = tool(device, "store", "dump", "--day", str(TODAY), "--prefix", "load.rival").out.decode()
        self.assertEqual([float(row["value"]) for row in csv.DictReader(io.StringIO(dump))],
                         [int(commits), *range(1, int(commits) + 1)])
        say(f"{len(runs)} daily runs, the longest {max(run.seconds for run in runs):.1f} s, beside "
                 f"{commits} commits, {rate} a second")

    def messages(self, send):
        """Sends to a program that waits for a list; the device after it has ended, with bounded memory."""
        device = BusDevice()
        self.addCleanup(device.remove)
        device.whitelist(G=group({"a": {}}))
        device.store([("a", device.today - 1, 1)])
        device.tool("send", "logging")
        status, peaks = pathlib.Path("/proc", (device.folder / "pid").read_text().strip(), "status"), [0]

        def follow():
            with contextlib.suppress(OSError, IndexError):  # it ends
                while True:
                    peaks.append(int(status.read_text().partition("VmHWM:")[2].split()[0]))
                    time.sleep(0.2)
        follower = threading.Thread(target=follow, daemon=True)
        follower.start()
        send(device)
        device.wait_for_end()
        follower.join(30)
        self.assertTrue(max(peaks) < 96 * MIB or not MEMORY_COUNTS)
        return device

    def test_applications(self):
        most = 20_000  # that a message may have
        apps = [{"bundle_id": f"org.example.app{i}", "version": "1", "adam_id": i, "arch": 1,
                 "uuid": "00112233-4455-6677-8899-aabbccddeeff"} for i in range(most + 1)]

        def send(device):
            with device.kept_awake():
                for elements, status in ((apps, 1), (apps[:most], 0)):
                    device.tool("send", "apps", "-", stdin=json.dumps(elements).encode(), status=status)
        device = self.messages(send)
        self.assertEqual([app["adamID"] for app in device.log()["TBActivatedAppInfo"]], list(range(most)))
        self.assertEqual(device.error_texts(), [
            f"endpoint {NAME}: a message is refused: more elements than a message may have"])

    def test_flood(self):
        count = sized(500_000)

        def send(device):
            peer = RawPeer(device)
            for flags in (peer.NO_REPLY, 0):
                for _ in range(count):
                    peer.send(int64_fields(operation=2), flags=flags)  # without a list
            peer.wait_for_answers(count)
            peer.socket.close()
        skipped = 'message skipped: no array "app_data"'
        self.assertEqual(self.messages(send).error_texts(), [skipped, f"{skipped}: {2 * count - 1} more"])


if __name__ == "__main__":
    unittest.main()
