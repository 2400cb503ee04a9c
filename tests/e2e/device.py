"""A device root in a temporary folder, and the real programs run on it."""
import glob
import os
import pathlib
import plistlib
import re
import shutil
import subprocess
import tempfile
import time
import unittest

BIN = pathlib.Path(os.environ["TALLYRUN_BIN"])
PROGRAM_DOMAIN = "vellum.tallyd.tallyrun"
LAST_DAY = "LastCrashLogSerializationDateInDaysSince1970"
TODAY = 20514  # 2026-03-02
NOON = 43200
WHITELIST = "Library/Application Support/Tallybook/Whitelist_Nimbus.plist"
STORE = "var/mobile/Library/Tallybook/TBDataStore.sqlitedb"
SPOOL = "var/mobile/Library/Logs/Submission"
PREFERENCES = "var/mobile/Library/Preferences"
FAKETIME_LIBRARY = glob.glob("/usr/lib/*/faketime/libfaketime.so.1")[0]


def checked(*command, status=0, **environment):
    """The output of a command that must end with that status; of one that fails, the errors."""
    result = subprocess.run([str(part) for part in command], env={**os.environ, **environment}, capture_output=True,
                            text=True, timeout=600)
    assert result.returncode == status, (command, (result.stdout + result.stderr)[-3000:])
    return result.stderr if status else result.stdout


def group(scalars=None, distributions=None, **prefixes):
    return {"ScalarKeys": scalars or {}, "DistributionKeys": distributions or {},
            "ScalarKeyPrefixes": prefixes.get("scalar_prefixes", {}),
            "DistributionKeyPrefixes": prefixes.get("distribution_prefixes", {})}


class Device:
    today = TODAY  # the day of its runs

    def __init__(self, root=None):
        self.root = root or pathlib.Path(tempfile.mkdtemp(prefix="tally-e2e-"))
        if root is None:
            self.describe()

    def remove(self):
        shutil.rmtree(self.root, ignore_errors=True)

    def write(self, path, content):
        target = self.root / path
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_bytes(content if isinstance(content, bytes) else plistlib.dumps(content))
        return target

    def whitelist(self, **groups):
        self.write(WHITELIST, groups)

    def describe(self, **entries):
        # Without a known build there is no system update, which other tests cover.
        entries.setdefault("SystemVersion", {})
        # The boot session and the day decide whether the storage figures are sent as events: here they
        # never are on the device's own day, whatever the machine and the day of the test.
        entries.setdefault("KernelValues", {}).setdefault(
            "kern.bootsessionuuid", b"%d0000000" % ((self.today + 1) % 2))
        self.write("device/device.plist", entries)

    def fill(self):
        """One whitelisted scalar on each of the last days and of the next."""
        self.whitelist(G=group({"a": {}}))
        self.store([("a", day, day) for day in range(self.today - 4, self.today + 4)])

    def store(self, scalars=(), distributions=()):
        """scalars: (key, day, value); distributions: (key, day, [values])."""
        rows = ["kind,key,day,offset,value", *(f"scalar,{key},{day},,{value}" for key, day, value in scalars)]
        rows += [f"distribution,{key},{day},{offset},{value!r}" for key, day, values in distributions
                 for offset, value in enumerate(values)]
        self.tool("store", "import", "-", stdin="\n".join(rows).encode())

    def environment(self, day=None, seconds=NOON, **more):
        environment = dict(os.environ, TALLYRUN_ROOT=str(self.root), TALLYRUN_LOG="stderr", TZ="UTC",
                           LANG="C", LC_ALL="C", LANGUAGE="", **more)
        environment.pop("TALLYRUN_LOG_LEVEL", None)
        # A preloaded library comes before the sanitizer's runtime, which is fine here.
        environment["ASAN_OPTIONS"] = environment.get("ASAN_OPTIONS", "") + ":verify_asan_link_order=0"
        if day is not None:
            # Preloaded by hand: a killed faketime program leaves a semaphore named after its process, and
            # fails when that number is used again.
            moment = time.strftime("@%Y-%m-%d %H:%M:%S", time.gmtime(day * 86400 + seconds))
            environment.update(LD_PRELOAD=FAKETIME_LIBRARY, FAKETIME=moment, NO_FAKE_STAT="1",
                               DONT_FAKE_MONOTONIC="1")
        return environment

    def command(self, *arguments):
        return [str(BIN / "tallyrun"), *arguments]

    def run(self, *arguments, day=TODAY, seconds=NOON):
        """Runs tallyrun at that time; the messages, without their prefix, by level and text."""
        result = subprocess.run(self.command(*arguments), capture_output=True, timeout=120,
                                env=self.environment(day, seconds))
        assert result.returncode == 0, (result.returncode, result.stderr[-2000:])
        return parse_messages(result.stderr)

    def start(self, *arguments, day=TODAY):
        return subprocess.Popen(self.command(*arguments), stderr=subprocess.PIPE,
                                env=self.environment(day))

    def tool(self, *arguments, stdin=b"", status=0, day=None):
        """With a status of None, any will do."""
        result = subprocess.run([str(BIN / "tallyctl"), "--root", str(self.root), *arguments],
                                input=stdin, capture_output=True, timeout=120,
                                env=self.environment(day))
        assert status in (None, result.returncode), (arguments, result.returncode, result.stderr[-2000:])
        return result.stdout.decode()

    def preferences(self, domain=PROGRAM_DOMAIN):
        path = self.root / PREFERENCES / f"{domain}.plist"
        return plistlib.loads(path.read_bytes()) if path.exists() else {}

    def set_preferences(self, domain=PROGRAM_DOMAIN, **values):
        self.write(f"{PREFERENCES}/{domain}.plist", values)

    def log_files(self):
        return sorted((self.root / SPOOL).glob("*.log"))

    def logs(self):
        return [plistlib.loads(path.read_bytes()) for path in self.log_files()]

    def log(self):
        only, = self.logs()
        return only

    def info(self, path):
        return plistlib.loads(path.with_name(path.name[:-len(".log")] + ".info.plist").read_bytes())


def parse_messages(stderr):
    # The storage library writes lines of its own, some without an end.
    return re.findall(r"tallyrun\[(\w+)\]: (.*)", stderr.decode())


# What the sweep says of a device without a storage driver; which of them depends on the day.
WITHOUT_STORAGE = {"error reading nand info, error 1 with message Unable to parse buffer",
                   "failed to get NAND info dict"}


def texts(messages, level=None):
    return [text for found, text in messages
            if level in (None, found) and text not in WITHOUT_STORAGE]


class DeviceTest(unittest.TestCase):
    def setUp(self):
        self.device = self.fresh()

    def fresh(self):
        device = Device()
        self.addCleanup(device.remove)
        return device

    def simple(self):
        device = self.fresh()
        device.fill()
        return device

    def logged_days(self, device):
        return [log["TBScalars"]["a"] for log in device.logs()]
