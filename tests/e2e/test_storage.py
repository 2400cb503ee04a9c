"""The sample storage of examples/device: what its driver exports reaches the log, and its lists their records."""
import csv
import io
import json
import pathlib
import plistlib
import struct
import subprocess
import sys
import unittest

from device import DeviceTest, SPOOL, TODAY, group

SAMPLE = pathlib.Path(__file__).resolve().parents[2] / "examples/device"
BUFFER = "device/storage-statistics.bin"
PREFIX = "vellum.NANDInfo."
STRUCTURED_DATA = "var/mobile/Library/Logs/StructuredData"
# Report names and where their values stand in the driver's buffer: key and element.
SPOTS = {"NumLogicalReads": (7, 0), "BytesPerPage": (49, 0), "BandsMaxTempHisto21": (327, 21),
         "CacheDepthVsThroughput255": (460, 255), "PadSize4": (121, 3), "E2E_F2H_SL_UECC": (280, 11),
         "spareAvailablePercent": (532, 0), "ReadsBeforeErasure50000": (265, 1)}


def records(buffer):
    found, at = {}, 0
    while at < len(buffer):
        key, count = struct.unpack_from("<II", buffer, at)
        found[key] = struct.unpack_from(f"<{count}Q", buffer, at + 8)
        at += 8 + 8 * count
    return found


class Storage(DeviceTest):
    def sample(self, *lists):
        for script, *arguments in (("make-storage.py", str(TODAY)), ("make-storage-lists.py", *lists))[:1 + bool(lists)]:
            subprocess.run([sys.executable, SAMPLE / script, self.device.root, *arguments], check=True)

    def structured(self, kind):
        return [record for path in sorted((self.device.root / STRUCTURED_DATA).glob(f"*-{kind}.plist"))
                for record in plistlib.loads(path.read_bytes())["Records"]]

    def test_the_next_day_reports_what_the_driver_exported(self):
        self.sample()
        device = self.device
        device.whitelist(G=group(scalar_prefixes={"vellum.": {}}))
        buffer = (device.root / BUFFER).read_bytes()
        expected = {PREFIX + name: records(buffer)[key][element] for name, (key, element) in SPOTS.items()}
        expected |= {PREFIX + "VMFreezer.NumPhysicalWrites": 522_305_536, "vellum.hwreport.wakeups": 48_210}
        device.run("-f")
        self.assertEqual(self.structured(172), [{"id": 3, "count": 2, "reg0": 0x1F40, "reg1": -1},
                                                {"id": 4, "count": 1, "reg0": 0x2A00}])
        device.run("-f", day=TODAY + 1)
        scalars = device.log()["TBScalars"]
        self.assertEqual({key: scalars.get(key) for key in expected}, expected)
        self.assertIn("98 %", device.tool("nand", "health"))
        # A bad buffer costs the storage figures only.
        (device.root / BUFFER).write_bytes(buffer[:-8])
        device.run("-f", day=TODAY + 2)
        dump = device.tool("store", "dump", "--day", str(TODAY + 2))
        swept = {row["key"] for row in csv.DictReader(io.StringIO(dump))}
        self.assertFalse(any(key.startswith(PREFIX) for key in swept))
        self.assertIn("vellum.hwreport.wakeups", swept)

    def test_lists_and_the_weekly_log(self):
        self.sample("nvme", "2")
        device = self.device
        words = {}
        for name in ("telemetry-0", "defects"):
            data = (device.root / f"device/storage-{name}.bin").read_bytes()
            words[name] = struct.unpack(f"<{len(data) // 4}i", data)
        buses = json.loads(device.tool("nand", "telemetry", "--json"))[0]["buses"]
        self.assertEqual([(bus["readStage"][0], bus["RD"]) for bus in buses],
                         [(words["telemetry-0"][1024 * i], words["telemetry-0"][4096 + 8 * i]) for i in range(4)])
        found = json.loads(device.tool("nand", "defects", "--json"))["defects"]
        self.assertEqual([defect["Reason"] for defect in found],
                         [words["defects"][7 + 8 * i] + added for i, added in enumerate((0, 200, 100, 0))])
        validity = json.loads(device.tool("nand", "validity", "--json"))
        self.assertTrue(json.loads(device.tool("nand", "storage-log", "--preview", "--json"))["wouldBeWritten"])
        self.assertFalse((device.root / SPOOL).exists(), "a preview leaves nothing behind")
        # On the days between the lists are recorded, the log is not written.
        for run, (day, logs) in enumerate(((TODAY, 1), (TODAY + 6, 1), (TODAY + 8, 2)), 1):
            subprocess.run(device.command("-f"), check=True, capture_output=True, timeout=120,
                           env=device.environment(day))
            texts = [path.read_text() for path in sorted((device.root / SPOOL).glob("*-StorageStatus.log"))]
            self.assertEqual((len(texts), len(self.structured(176))), (logs, run * 17))
        header, line = texts[0].split("\n\n")
        self.assertIn("Date: 2026-03-02 12:00:0", header)
        self.assertIn(";UserWamp:0.56;", line)
        for name, values in validity.items():
            self.assertIn(f"{name}:{','.join(map(str, values))}", line)


if __name__ == "__main__":
    unittest.main()
