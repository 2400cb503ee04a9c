"""Logs on their way out: numbers, hand-over, hooks, and the example uploader against a collector."""
import http.server
import os
import pathlib
import re
import shutil
import subprocess
import threading
import time
import unittest

from device import BIN, DeviceTest, SPOOL, TODAY
from installed import main_with_optional_clients

OUTGOING = "var/spool/tallyrun"
HOOKS = "etc/tallyrun.d/submitted"
IDENTITY = "var/mobile/Library/Tallybook/SubmissionIdentity.plist"
UPLOADER = pathlib.Path(__file__).parents[2] / "examples/uploader/upload"


def is_alive(process):
    try:
        return pathlib.Path(f"/proc/{process}/stat").read_text().split()[2] != "Z"
    except (FileNotFoundError, ProcessLookupError):
        return False


class HandingOver(DeviceTest):
    def setUp(self):
        super().setUp()
        self.device.fill()
        (self.device.root / OUTGOING).mkdir(parents=True)

    def submit(self, *days):
        for day in days:
            messages = self.device.run("-d", day=TODAY + day)
        return messages

    def take(self, to=f"/{OUTGOING}", *more, status=0):
        out = self.device.root / to[1:]
        self.device.tool("report", "take", "--to", out, *more, status=status)
        return sorted(out.glob("*.log"))

    def marks(self, logs):
        return [(info["DevicePseudonym"], info["SequenceNumber"]) for info in map(self.device.info, logs)]

    def withdraw(self):
        self.device.set_preferences("vellum.tallyd", DiagnosticSubmissionEnabled=False)


class Numbers(HandingOver):
    def test_numbers_rise_until_the_pseudonym_is_another(self):
        device = self.device
        device.describe(SystemVersion={"ProductName": "Trailhead", "ProductVersion": "4.2", "ProductBuildVersion": "R1180"})
        self.submit(0, 1)
        first, second = self.marks(device.log_files())
        self.assertRegex(first[0], "^[0-9a-f]{32}$")
        self.assertEqual((first[1], second), (1, (first[0], 2)))
        self.assertEqual(device.info(device.log_files()[0])["SystemVersion"], "Trailhead 4.2 (R1180)")
        shutil.rmtree(device.root / SPOOL)  # an uploader of another kind
        self.submit(2)
        self.assertEqual(self.marks(device.log_files()), [(first[0], 3)])
        (device.root / IDENTITY).write_bytes(b"damaged")
        complaints = [text for level, text in self.submit(3) if level == "error" and "pseudonym" in text]
        self.assertEqual(len(complaints), 1)
        self.assertIn("count from 1", device.tool("report", "pseudonym", "--reset"))
        self.submit(4)
        *_, former, latest = self.marks(device.log_files())
        self.assertEqual((former[1], latest[1]), (1, 1))
        self.assertEqual(len({first[0], former[0], latest[0]}), 3)

    def test_withdrawn_consent_takes_everything_back(self):
        self.submit(0)
        self.take()
        self.submit(1)
        self.withdraw()
        self.take(status=1)
        self.assertEqual(len(self.device.log_files()), 1)
        self.submit(2)
        left = [path for folder in (SPOOL, OUTGOING) for path in (self.device.root / folder).iterdir()
                if not path.name.startswith(".")]
        self.assertEqual(left, [])
        self.assertFalse((self.device.root / IDENTITY).exists())
        self.assertIn("no pseudonym yet", self.device.tool("report", "pseudonym"))


class Take(HandingOver):
    def test_logs_are_moved_unchanged_and_replace_nothing(self):
        device = self.device
        self.submit(0, 1)
        before = [path.read_bytes() for path in device.log_files()]
        out = device.root / OUTGOING
        (out / "0000000001-log-tallyd.log").write_text("another's")
        out.chmod(0o2750)
        self.assertEqual(self.take(f"/{OUTGOING}", "--type", "none"), [out / "0000000001-log-tallyd.log"])
        _, *taken = self.take()
        self.assertEqual([path.read_bytes() for path in taken], before)
        self.assertEqual([number for _, number in self.marks(taken)], [1, 2])
        self.assertEqual({path.stat().st_mode & 0o7777 for path in out.glob("*000[23]-*")}, {0o640})
        self.assertEqual(list((device.root / SPOOL).glob("0*")), [])

    def test_where_logs_are_not_moved(self):
        self.submit(0)
        root = self.device.root
        for case, target, status in (("missing, and what is above", "/out/put", 1), ("the spool", f"/{SPOOL}", 1),
                                     ("a file", "/device/device.plist", 1), ("another user's link", "/theirs/link", 1)):
            if "link" in case:
                (root / "theirs").mkdir()
                (root / "theirs/link").symlink_to(root / OUTGOING)
                (root / "theirs").chmod(0o777)
            with self.subTest(case):
                self.device.tool("report", "take", "--to", f"{root}{target}", status=status)
                self.assertEqual(len(self.device.log_files()), 1)
        os.rename(root / SPOOL, root / "kept")
        for target in "out/put", SPOOL:
            self.device.tool("report", "take", "--to", f"{root}/{target}", status=1)
        os.rename(root / "kept", root / SPOOL)
        if os.getuid() == 0 and subprocess.run(["mount", "-t", "tmpfs", "tally", root / OUTGOING],
                                               check=False, capture_output=True).returncode == 0:
            try:  # another volume, like any directory
                self.assertEqual(len(self.take()), 1)
            finally:
                subprocess.run(["umount", root / OUTGOING], check=True)


@unittest.skipUnless(os.getuid() == 0, "hooks belong to root and run as somebody else")
class Hooks(HandingOver):
    def setUp(self):
        super().setUp()
        root = self.device.root
        self.notes = root / "notes"
        self.notes.mkdir()
        for path, mode in ((root, 0o755), (self.notes, 0o777), (root / OUTGOING, 0o2770)):
            path.chmod(mode)
        shutil.chown(root / OUTGOING, group="nogroup")
        (root / HOOKS).mkdir(parents=True)
        self.submit(0, 1)
        self.assertEqual(len(self.take()), 2)

    def hook(self, name, body, mode=0o755):
        path = self.device.root / HOOKS / name
        path.write_text(f"#!/bin/sh\n{body}\n")
        path.chmod(mode)
        return path

    def run_hooks(self, *options, user="nobody"):
        result = subprocess.run([BIN / "tallyctl", "--root", self.device.root, "report", "hooks", *options],
                                capture_output=True, timeout=120, user=user, group="nogroup", extra_groups=[],
                                env=self.device.environment())
        return result.returncode, (result.stdout + result.stderr).decode()

    def waiting(self):
        return len(list((self.device.root / OUTGOING).glob("*.log")))

    def said(self):
        return "".join(path.read_text() for path in sorted(self.notes.iterdir()))

    def test_hooks_run_in_order_until_all_are_content(self):
        self.hook("20-second", f'echo "second $TALLYRUN_SEQUENCE" >> {self.notes}/said; [ -e {self.notes}/pass ]')
        self.hook("10-first", f'[ -s "$1" ] && [ -s "$2" ] && echo "first $(id -un)" >> {self.notes}/said')
        self.hook("30-off", "exit 1", mode=0o644)
        self.hook("40.dpkg-old", "exit 1")
        self.assertEqual(self.run_hooks(user=0)[0], 1)
        self.assertEqual((self.run_hooks()[0], self.waiting()), (1, 2))
        self.assertEqual(self.said(), "first nobody\nsecond 1\nfirst nobody\nsecond 2\n")
        (self.notes / "pass").touch()
        self.assertEqual((self.run_hooks()[0], self.waiting()), (0, 0))
        self.assertEqual([path.name for path in (self.device.root / OUTGOING).iterdir()], [])

    def test_a_hook_that_others_can_change_stops_all(self):
        self.hook("10-good", f"echo ran >> {self.notes}/said")
        bad = self.hook("20-bad", "true")
        folder, above = self.device.root / HOOKS, self.device.root / "etc"
        cases = (("writable by its group", lambda: bad.chmod(0o775)),
                 ("another's", lambda: (bad.chmod(0o755), shutil.chown(bad, "nobody"))),
                 ("a link", lambda: (bad.unlink(), bad.symlink_to("10-good"))),
                 ("in a folder for all", lambda: (bad.unlink(), folder.chmod(0o777))),
                 ("below a folder of another's", lambda: (folder.chmod(0o755), shutil.chown(above, "nobody"))))
        for case, make in cases:
            with self.subTest(case):
                make()
                status, said = self.run_hooks()
                self.assertEqual((status, self.said(), self.waiting()), (1, "", 2), said)
                self.assertRegex(self.device.tool("doctor", status=1), "hooks +.*(no hook is run|symbolic)")

    def test_a_hook_that_hangs_is_killed_with_its_children(self):
        self.hook("hang", f"sleep 600 & echo $! >> {self.notes}/children; sleep 600")
        began = time.monotonic()
        status, said = self.run_hooks("--limit", "1")
        self.assertLess(time.monotonic() - began, 60)
        self.assertEqual((status, self.waiting()), (1, 2))
        self.assertIn("did not end within 1 s", said)
        for child in self.said().split():
            until = time.monotonic() + 10  # a kill takes effect when its process is scheduled next
            while is_alive(child) and time.monotonic() < until:
                time.sleep(0.05)
            self.assertFalse(is_alive(child), "a child is alive")

    def test_without_consent_nothing_runs(self):
        self.hook("any", f"echo ran >> {self.notes}/said")
        self.withdraw()
        self.assertEqual((self.run_hooks()[0], self.said(), self.waiting()), (1, "", 2))

    @unittest.skipUnless(shutil.which("curl"), "curl is missing")
    def test_the_example_uploads_each_log_once(self):
        received, answers = {}, [503, None, 201, 429, 200]

        class Collector(http.server.BaseHTTPRequestHandler):
            def do_POST(self):
                body = self.rfile.read(int(self.headers["Content-Length"]))
                answer = answers.pop(0)
                if answer is None:  # the connection is lost, and nobody knows what arrived
                    self.connection.close()
                    return
                if answer < 300:
                    received.setdefault(self.headers["Idempotency-Key"], []).append(body)
                self.send_response(answer)
                self.end_headers()

            def log_message(self, *_):
                pass

        server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Collector)
        self.addCleanup(server.server_close)
        self.addCleanup(server.shutdown)
        threading.Thread(target=server.serve_forever, daemon=True).start()
        script = re.sub("^collector=.*", f"collector=http://127.0.0.1:{server.server_port}/logs",
                        UPLOADER.read_text(), flags=re.M)
        path = self.device.root / HOOKS / "upload"
        path.write_text(script)
        path.chmod(0o755)
        logs = sorted((self.device.root / OUTGOING).glob("*.log"))
        bodies = [log.read_bytes() for log in logs]
        keys = [f"{device}-{number}-log-tallyd" for device, number in self.marks(logs)]
        status, said = self.run_hooks()
        self.assertEqual((status, self.waiting(), answers), (0, 0, []), said)
        self.assertEqual(list(received), keys)
        for key, body in zip(keys, bodies):
            only, = received[key]
            self.assertIn(body, only)
            self.assertIn(b"DevicePseudonym", only)


if __name__ == "__main__":
    main_with_optional_clients()
