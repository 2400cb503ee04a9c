"""What tallyctl doctor says of the recorder: absent, at work, unable to commit, or where others could replace it."""
import json
import os
import socket
import subprocess
import time
import unittest

from device import BIN, PREFERENCES, STORE, DeviceTest


class RecorderHealth(DeviceTest):
    def rows(self):
        found = json.loads(self.device.tool("--json", "doctor", status=None))
        return [f"{row['health']}: {row['text']}" for row in found if row["subject"].startswith("recorder")]

    def expect(self, *wanted):
        rows = self.rows()
        self.assertEqual(len(rows), len(wanted), rows)
        for row, pattern in zip(rows, wanted):
            self.assertRegex(row, pattern)

    def start(self):
        recorder = subprocess.Popen([BIN / "tallyd"], env=self.device.environment(), stderr=subprocess.DEVNULL)
        self.addCleanup(recorder.wait)
        self.addCleanup(recorder.kill)
        end = time.monotonic() + 30
        while not (self.device.root / "run/tallyd/control.sock").exists():
            self.assertLess(time.monotonic(), end)
            time.sleep(0.01)
        return recorder

    def send(self, *datagrams):
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as client:
            client.connect(str(self.device.root / "run/tallyd/statsd.sock"))
            for datagram in datagrams:
                client.send(datagram)

    def test_what_is_found(self):
        self.expect("^missing: none runs")
        self.device.write("Library/Preferences/tallyd.plist", {"CommitInterval": 60})
        recorder = self.start()
        self.send(b"a:1|c\nb:2|g", b"a:1|s", b"_e{1,1}:a|b")
        self.expect("^ok: .* MiB held in memory, 2 metrics", r"^missing: refused: 1 \(a set .*, 1 \(an event",
                    "^ok: commits every 60 seconds, within 32.0 MiB")
        self.send(b"never:1|s")
        found = json.loads(self.device.tool("--json", "explain", "never", "--day", "today", status=1))
        self.assertEqual(found["absence"]["scalar"], "refused_by_recorder")
        self.assertIn("a set (type s)", found["whyAbsent"]["scalar"])

        # The store is another file's link, which is never followed.
        (self.device.root / STORE).parent.mkdir(parents=True, exist_ok=True)
        (self.device.root / STORE).symlink_to(self.device.root / "elsewhere")
        with socket.socket(socket.AF_UNIX) as control:
            control.connect(str(self.device.root / "run/tallyd/control.sock"))
            control.sendall(b"commit\n")
            self.assertRegex(control.makefile().read(), "^failed: ")
        self.device.write(f"{PREFERENCES}/tallyd.d/shop.plist", {"CommitInterval": "soon", "Prefx": "a"})
        self.expect("^wrong: .*its last commit failed: .*TBDataStore", "^missing: refused",
                    "^wrong: .*shop.plist: (CommitInterval|Prefx) is not", "^wrong: .*shop.plist: ")

        recorder.kill()
        recorder.wait()
        (self.device.root / "run/tallyd").chmod(0o777)
        self.expect("^wrong: .*can be written by other users", "^wrong: ", "^wrong: ")

    def test_another_user_may_not_ask_and_sees_nothing_wrong(self):
        if os.geteuid() != 0:
            self.skipTest("only root can be another user")
        self.start()
        for folder in self.device.root, self.device.root / "run":
            folder.chmod(0o755)
        out = subprocess.run(["setpriv", "--reuid=1234", "--clear-groups", BIN / "tallyctl", "--root", self.device.root,
                              "--json", "doctor"], capture_output=True, timeout=60, check=False).stdout
        text, = (row["text"] for row in json.loads(out) if row["subject"] == "recorder")
        self.assertRegex(text, "only root and its own user may ask")


if __name__ == "__main__":
    unittest.main()
