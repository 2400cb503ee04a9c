"""A user who exchanges directories and files for links while root works in them gains nothing."""
import contextlib
import ctypes
import os
import pathlib
import signal
import subprocess
import sys
import time
import unittest

from device import PREFERENCES, STORE, DeviceTest, group

USER = 12345
RUNS = 200
HOME = "var/mobile"
SECRET = b"<key>secret</key><string>only root reads this</string>"
TRAPS = f"{HOME}/traps"
# What is exchanged, and for what: a link to a foreign file or directory, or a second name of a foreign file.
EXCHANGES = [
    (PREFERENCES, "symlink", "Library/Preferences"),
    (f"{PREFERENCES}/vellum.tallyd.tallyrun.plist", "symlink", "foreign/secret.plist"),
    (f"{PREFERENCES}/vellum.tallyd.plist", "link", "foreign/secret.plist"),
    (f"{HOME}/Library/Tallybook", "symlink", "foreign"),
    (STORE, "symlink", "foreign/store"),
    (STORE, "link", "foreign/store"),
    (STORE, "symlink", "foreign/absent"),
    (f"{STORE}-wal", "link", "foreign/secret.plist"),
    (f"{STORE}-shm", "link", "foreign/secret.plist"),
    (f"{STORE}-journal", "symlink", "foreign/secret.plist"),
    (f"{HOME}/Library/Tallybook/tallyrun.lock", "link", "foreign/secret.plist"),
    (f"{HOME}/Library/Logs", "symlink", "foreign"),
    (f"{HOME}/Library/Logs/Submission", "symlink", "foreign/Submission"),
    (f"{HOME}/Library/Logs/StructuredData", "symlink", "foreign/Submission"),
    (f"{HOME}/Library/Logs/Fixline", "symlink", "foreign/Fixline"),
    (f"{HOME}/Library", "symlink", "foreign"),
]


def rival(root):
    """Exchanges names until it is killed; both ways, so that what was there comes back."""
    exchange = ctypes.CDLL(None, use_errno=True).renameat2
    names = [(str(root / path).encode(), str(root / TRAPS / str(number)).encode())
             for number, (path, _, _) in enumerate(EXCHANGES)]
    os.setgroups([])
    os.setgid(USER)
    os.setuid(USER)
    for number in range(10**9):
        path, trap = names[number % len(names)]
        for _ in range(2):
            if exchange(-100, path, -100, trap, 2) != 0 and number < len(names):
                with contextlib.suppress(OSError), open(path, "ab"):
                    pass  # made, so that there is something to exchange
            if number % 7 == 0:
                time.sleep(0.0003)  # long enough for a call to be caught in between


class HostileUser(DeviceTest):
    def setUp(self):
        if os.geteuid() != 0:
            self.skipTest("only root works in the directories of others")
        super().setUp()

    def prepare(self):
        device = self.device
        device.root.chmod(0o755)
        device.whitelist(G=group({"a": {}}))
        device.write("Library/Preferences/vellum.Ferryman.plist", {"of": "the system"})
        for name in ("secret.plist", "store", "Submission/0000000001-log-tallyd.log",
                     "Submission/0000000002-172.pending", "Fixline/fix.log"):
            device.write(f"foreign/{name}", SECRET).chmod(0o600)
        (device.root / "foreign").chmod(0o700)
        for name in ("Submission", "StructuredData", "Fixline"):
            (device.root / HOME / "Library/Logs" / name).mkdir(parents=True)
        device.set_preferences("vellum.tallyd", DiagnosticSubmissionEnabled=True)
        device.run("-f", day=None)
        traps = device.root / TRAPS
        traps.mkdir()
        for number, (_, kind, target) in enumerate(EXCHANGES):
            getattr(os, kind)(device.root / target, traps / str(number))
        subprocess.run(["find", device.root / HOME, "(", "-type", "d", "-o", "-links", "1", ")",
                        "-exec", "chown", "-h", f"{USER}:{USER}", "{}", "+"], check=True)
        return device

    def foreign(self, device):
        """Owners, modes and contents."""
        return subprocess.run("find foreign Library -printf '%p %U %G %m\n' -type f -exec md5sum {} +",
                              cwd=device.root, shell=True, check=True, capture_output=True).stdout.splitlines()

    def test_foreign_files_stay_as_they_are(self):
        device = self.prepare()
        before = self.foreign(device)
        with subprocess.Popen([sys.executable, __file__, "rival", str(device.root)]) as process:
            try:
                for number in range(RUNS):
                    device.run(("-f", "-d")[number % 2], day=None)
                    if number % 10 == 0:
                        device.tool("store", "set", "a", "1", status=None)
                self.assertIsNone(process.poll(), "the rival ended by itself")
            finally:
                process.send_signal(signal.SIGKILL)
        self.assertEqual(self.foreign(device), before)
        leaks = subprocess.run(["find", device.root / HOME, "-type", "f", "-links", "1",
                                "-exec", "grep", "-l", "only root reads this", "{}", "+"], capture_output=True)
        self.assertEqual(leaks.stdout, b"")


if __name__ == "__main__":
    if sys.argv[1:2] == ["rival"]:
        rival(pathlib.Path(sys.argv[2]))
    else:
        unittest.main()
