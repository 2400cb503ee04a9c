"""tallyctl on the sample device: the commands of the README, and that looking changes nothing."""
import hashlib
import json
import pathlib
import re
import shutil
import subprocess
import sys
import unittest

from device import BIN, SPOOL, TODAY, WHITELIST, DeviceTest

TOP = pathlib.Path(__file__).resolve().parents[2]
SAMPLE = TOP / "examples" / "device"


def checksums(root):
    return {str(path.relative_to(root)): hashlib.sha256(path.read_bytes()).hexdigest()
            for path in sorted(root.rglob("*")) if path.is_file()}


class ToolTest(DeviceTest):
    def setUp(self):
        self.device = self.fresh()
        self.device.write(WHITELIST, (SAMPLE / "Whitelist_Nimbus.plist").read_bytes())
        self.device.write("device/device.plist", (SAMPLE / "device.plist").read_bytes())
        day = subprocess.run([sys.executable, SAMPLE / "make-day.py", str(TODAY - 1)],
                             capture_output=True, check=True)
        self.device.tool("store", "import", "-", stdin=day.stdout)
        self.device.run("-f")

    def tool(self, *arguments):
        """Runs tallyctl on the device's today; status and both outputs."""
        result = subprocess.run([BIN / "tallyctl", *arguments], capture_output=True, timeout=120,
                                env=self.device.environment(TODAY))
        return result.returncode, result.stdout.decode(), result.stderr.decode()

    def test_the_tour_of_the_readme(self):
        tour = re.findall(r"^tallyctl (.+?)\s+#", (TOP / "README.md").read_text(), re.M)
        self.assertGreaterEqual(len(tour), 5)
        subprocess.run([sys.executable, TOP / "examples/device/make-storage.py", self.device.root,
                        str(TODAY)], check=True, stdout=subprocess.DEVNULL)
        for command in (line.replace("examples/", f"{TOP}/examples/") for line in tour):
            with self.subTest(command):
                status, out, err = self.tool(*command.split())
                self.assertEqual((status, err), (0, ""))
                self.assertNotIn("\x1b", out)
                self.assertLessEqual(max(map(len, out.splitlines())), 110)
                self.assertIsInstance(json.loads(self.tool(*command.split(), "--json")[1]), (dict, list))

    def test_looking_changes_nothing(self):
        before = checksums(self.device.root)
        for command in (["report", "preview"], ["report", "preview", "--diff"], ["report", "show"],
                        ["report", "list"], ["explain", "vellum.power.wakeups"], ["doctor"],
                        ["whitelist", "check"], ["whitelist", "test", "a"], ["store", "dump"],
                        ["store", "keys"], ["prefs", "list"], ["prefs", "get", "LastOSVersion"]):
            self.tool(*command)
            self.assertEqual(checksums(self.device.root), before, command)

    def test_the_preview_is_what_is_submitted(self):
        preview = json.loads(self.tool("report", "preview", "--json")[1])["document"]
        self.device.run("-f")
        shown = json.loads(self.tool("report", "show", "--json")[1])["document"]
        for document in (preview, shown):
            del document["TBLogCreationDate"]
            del document["TBScalars"]["vellum.usage.cur_boot_session_cpu_uptime"]
        self.assertEqual(preview, shown)

    def test_statuses_and_help(self):
        cases = [(["--help"], 0), (["report", "--help"], 0), (["whitelist", "test", "--help"], 0),
                 ([], 2), (["nonsense"], 2), (["report", "show", "--nonsense"], 2),
                 (["explain", "vellum.nothing.here"], 1), (["report", "show", "99"], 1)]
        for arguments, wanted in cases:
            with self.subTest(arguments):
                status, out, err = self.tool(*arguments)
                self.assertEqual(status, wanted)
                self.assertTrue(out or err)
        families = re.findall(r"^  (\w+) ", self.tool("--help")[1].split("Commands:")[1], re.M)
        ours = ["store", "whitelist", "report", "explain", "prefs", "doctor"]
        self.assertEqual([name for name in families if name in ours], ours)

    def test_streams_that_are_closed_or_full(self):
        log = self.device.log_files()[0]
        for command, out, wanted in (("report show - <" + str(log), "Daily log", 0),
                                     ("report show >/dev/full", "", 1), ("report show >&-", "", 1),
                                     ("report show >&9", "", 1)):
            with self.subTest(command):
                # 9 is a pipe that nobody reads.
                result = subprocess.run(["bash", "-c", "exec 9> >(exec true); wait $!; "
                                         f"'{BIN}/tallyctl' {command}"],
                                        capture_output=True, timeout=60, stdin=subprocess.DEVNULL,
                                        env=self.device.environment())
                self.assertEqual(result.returncode, wanted)
                self.assertIn(out, result.stdout.decode())
                self.assertEqual(b"cannot write to standard output" in result.stderr, wanted == 1)

    def test_versions_agree(self):
        tool, job = (subprocess.run([BIN / name, "--version"], capture_output=True, check=True,
                                    env=self.device.environment(TODAY))
                     for name in ("tallyctl", "tallyrun"))
        self.assertEqual(tool.stdout.split()[1:], job.stdout.split()[1:])
        self.assertEqual(job.stderr, b"")

    def test_a_spool_that_is_gone(self):
        shutil.rmtree(self.device.root / SPOOL)
        self.assertEqual(self.tool("report", "show")[0], 1)
        self.assertEqual(self.tool("report", "preview", "--diff")[0], 0)


if __name__ == "__main__":
    unittest.main()
