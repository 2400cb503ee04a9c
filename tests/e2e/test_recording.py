"""Recorded devices: recorded once more they are the same, and two days on one give the amounts of the second."""
import json
import os
import pathlib
import subprocess
import sys
import tempfile
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "devices"))
import device_tree
from device import BIN, TODAY, Device, checked, group

TREES = sorted(pathlib.Path(device_tree.__file__).parent.glob("*.tree"))
DISK = "sys/devices/pci0000:00/0000:00:1d.0/0000:3d:00.0/nvme/nvme0/nvme0n1/stat"


class Recording(unittest.TestCase):
    def unpacked(self, tree, **names):
        folder = tempfile.TemporaryDirectory(prefix="tally-e2e-")
        self.addCleanup(folder.cleanup)
        text = tree.read_text()
        for new, name in names.items():
            text = text.replace(name, new)
        device_tree.unpack(text, pathlib.Path(folder.name, "device"))
        return pathlib.Path(folder.name, "device")

    def sample(self, root, *options):
        # Not every channel has a value: the phone does not know its battery's cycles.
        out = Device(root).tool("--json", "channels", "sample", "--category", "1", *options, status=None)
        return [channel for channel in json.loads(out)["channels"] if channel["name"] != "time.span"]

    def disks(self, root):
        disks = json.loads(Device(root).tool("--json", "nand", "devices", status=None))
        return [{key: value for key, value in disk.items() if key != "identity"} for disk in disks]

    def test_a_recording_is_recorded_without_a_loss(self):
        for tree in TREES:
            with self.subTest(tree.stem):
                # The recorder gives the numbers that the tree has.
                device = self.unpacked(tree, enp0s31f6="if1", enx0011223344aa="if2", alice="host1", S4EVN0="serial1")
                copy = device.with_name("copy")
                checked(BIN / "tallyctl", "device", "record", copy, "--seconds", "0", TALLYRUN_ROOT=str(device))
                again = self.unpacked(tree)
                self.assertEqual(self.sample(copy), self.sample(again))
                self.assertEqual(self.disks(copy), self.disks(again))
                content = "".join(str(path) + (path.read_text("latin1") if path.is_file() else "")
                                  for path in copy.rglob("*"))
                for name in ("0011223344aa", "enp0s31f6", "alice", "S4EVN0"):
                    self.assertNotIn(name, content)
                refused = checked(BIN / "tallyctl", "--root", device, "device", "record", copy, status=1)
                self.assertIn("is not empty", refused)

    def test_samples_follow_the_clock_when_they_are_played(self):
        device = self.unpacked(TREES[[tree.stem for tree in TREES].index("laptop")])
        for options, reads in ((("--play",), 10), ((), 0)):
            changes = self.sample(device, "--group", "Disks", "--delta", "1.1", *options)
            self.assertEqual({channel["name"]: channel["value"] for channel in changes}["disk.nvme0n1.reads"], reads)

    @unittest.skipUnless(os.geteuid() == 0, "only root can be refused as another user")
    def test_doctor_says_what_is_refused(self):
        device = self.unpacked(TREES[[tree.stem for tree in TREES].index("laptop")])
        device.parent.chmod(0o755)
        (device / DISK).chmod(0)
        (device / "proc/interrupts").chmod(0)
        (device / "proc/pressure/cpu").unlink()
        (device / "proc/pressure/cpu").mkdir()
        lines = subprocess.run([BIN / "tallyctl", "--root", device, "doctor"], capture_output=True, text=True, user=12345,
                               check=False).stdout.splitlines()
        said = {line[11:31].strip(): line for line in lines}
        self.assertIn("17 channels, of which a file is not permitted", said["Disks"])
        self.assertIn("a file is not permitted (/proc/interrupts)", said["Interrupts"])
        self.assertRegex(said["Pressure"], r" [1-9] channels; a file is unreadable: .*cpu")
        self.assertIn("[ok]       Sleep", said["Sleep"])
        self.assertNotIn("absent", said["Sensors"])
        self.assertIn("NVMe, available", said["wear of nvme0n1"])
        board = Device(self.unpacked(TREES[0])).tool("doctor", status=None)
        self.assertRegex(board, "Memory errors +absent on this hardware")

    def test_the_second_day_has_its_amounts(self):
        device = Device(self.unpacked(TREES[[tree.stem for tree in TREES].index("laptop")]))
        device.whitelist(G=group({"a": {}}))
        device.run("-f")
        disk = device.root / DISK
        disk.write_text(disk.read_text().replace("100000", "100123", 1))
        device.run("-f", day=TODAY + 1)
        rows = [row.split(",") for row in device.tool("store", "dump").splitlines()]
        reads = {int(row[2]): int(row[4]) for row in rows if row[1].endswith("disk0.reads")}
        self.assertEqual(reads[TODAY + 1], 123)
        temperatures = [row[4] for row in rows if row[1].endswith("thermal0.temperature")]
        self.assertEqual(temperatures, ["45000", "45000"])


if __name__ == "__main__":
    unittest.main()
