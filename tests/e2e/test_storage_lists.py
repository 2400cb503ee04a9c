#!/usr/bin/env python3
"""The storage driver's lists on the sample device, for both controllers and all makes of parts."""
import json
import pathlib
import plistlib
import struct
import subprocess
import sys
import unittest

from device import SPOOL, TODAY, DeviceTest

SAMPLE = pathlib.Path(__file__).resolve().parents[2] / "examples/device"
# By parts: how many read stages are reported, and the word of a bus's block with the first one.
PARTS = {"0": (23, 256), "0a": (23, 256), "0b": (23, 256), "1": (23, 0), "2": (33, 0)}
STRUCTURED_DATA = "var/mobile/Library/Logs/StructuredData"


class StorageListsTest(DeviceTest):
    def sample(self, controller, parts):
        device = self.fresh()
        for script, *arguments in (("make-storage.py", str(TODAY)),
                                   ("make-storage-lists.py", controller, parts)):
            subprocess.run([sys.executable, SAMPLE / script, device.root, *arguments], check=True)
        return device

    def words(self, device, name):
        data = (device.root / "device" / name).read_bytes()
        return struct.unpack(f"<{len(data) // 4}i", data)

    def records(self, device):
        """All structured-data records of the storage, written out or not."""
        return [record for path in sorted((device.root / STRUCTURED_DATA).glob("*-176.plist"))
                for record in plistlib.loads(path.read_bytes())["Records"]]

    def storage_logs(self, device):
        return [path.read_text() for path in (device.root / SPOOL).glob("*-StorageStatus.log")]

    def run_day(self, device, day):
        subprocess.run(device.command("-f"), check=True, capture_output=True, timeout=120,
                       env=device.environment(day))

    def test_every_controller_and_generation(self):
        for controller in ("spx", "nvme"):
            for parts, (stages, first) in PARTS.items():
                with self.subTest(controller=controller, parts=parts):
                    device = self.sample(controller, parts)
                    modes = json.loads(device.tool("nand", "telemetry", "--json"))
                    self.assertEqual([mode["mode"] for mode in modes], [0, 1, 2])
                    for mode in modes:
                        raw = self.words(device, f"storage-telemetry-{mode['mode']}.bin")
                        self.assertEqual(len(mode["buses"]), 4)
                        for bus, record in enumerate(mode["buses"]):
                            self.assertEqual(len(record["readStage"]), stages)
                            self.assertEqual(record["readStage"][0], raw[1024 * bus + first])
                            self.assertEqual(record["RD"], raw[4096 + 8 * bus])
                            self.assertEqual(record["block_type"], mode["mode"])
                    raw = self.words(device, "storage-defects.bin")
                    added = (0, 0, 0, 0) if controller == "spx" else (0, 200, 100, 0)
                    self.assertEqual(
                        [defect["Reason"] for defect in
                         json.loads(device.tool("nand", "defects", "--json"))["defects"]],
                        [raw[3 + 8 * i + 4] + added[i] for i in range(4)])

    def test_a_week_of_runs(self):
        device = self.sample("nvme", "2")
        preview = json.loads(device.tool("nand", "storage-log", "--preview", "--json"))
        self.assertTrue(preview["wouldBeWritten"])
        self.assertFalse((device.root / SPOOL).exists(), "a preview leaves nothing behind")
        lists = json.loads(device.tool("nand", "validity", "--json"))
        self.assertEqual(list(lists), [f"ValidityList[{i}]" for i in (0, 1, 2, 3, 8, 15)])

        self.run_day(device, TODAY)
        self.assertEqual(len(self.records(device)), 3 * 4 + 1 + 4)
        (text,) = self.storage_logs(device)
        header, line = text.split("\n\n")
        self.assertIn("Date: 2026-03-02 12:00:0", header)
        self.assertIn(";UserWamp:0.56;", line)
        for name, values in lists.items():
            self.assertIn(f"{name}:{','.join(map(str, values))}", line)
        self.assertIn("SSLastLoggedAt", device.preferences())

        # On the days between the lists are recorded, the log is not written.
        self.run_day(device, TODAY + 6)
        self.assertEqual(len(self.storage_logs(device)), 1)
        self.assertEqual(len(self.records(device)), 2 * 17)
        self.run_day(device, TODAY + 8)
        self.assertEqual(len(self.storage_logs(device)), 2)


if __name__ == "__main__":
    unittest.main()
