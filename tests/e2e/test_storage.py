"""The sample storage of examples/device: what its driver exports is what a later log carries."""
import csv
import io
import pathlib
import plistlib
import struct
import subprocess
import sys
import unittest

from device import DeviceTest, TODAY, group

MAKE_STORAGE = pathlib.Path(__file__).resolve().parents[2] / "examples/device/make-storage.py"
BUFFER = "device/storage-statistics.bin"
PREFIX = "vellum.NANDInfo."
# Report names and where their values stand in the driver's buffer: key and element.
SPOTS = {"NumLogicalReads": (7, 0), "NumLogicalWrites": (4, 0), "BytesPerPage": (49, 0),
         "NumFlushes": (37, 0), "BandsMaxTempHisto0": (327, 0), "BandsMaxTempHisto21": (327, 21),
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
    def setUp(self):
        super().setUp()
        subprocess.run([sys.executable, MAKE_STORAGE, self.device.root, str(TODAY)], check=True)
        self.device.whitelist(G=group(scalar_prefixes={"vellum.": {}}))

    def swept(self, day=TODAY):
        dump = self.device.tool("store", "dump", "--day", str(day))
        return {row["key"]: int(row["value"]) for row in csv.DictReader(io.StringIO(dump))
                if row["kind"] == "scalar"}

    def test_the_next_day_reports_what_the_driver_exported(self):
        exported = records((self.device.root / BUFFER).read_bytes())
        expected = {PREFIX + name: exported[key][element]
                    for name, (key, element) in SPOTS.items()}
        self.device.run("-f")
        swept = self.swept()
        self.assertEqual({key: swept.get(key) for key in expected}, expected)
        self.assertEqual(sum(key.startswith(PREFIX) for key in swept), 710)
        self.assertEqual(swept[PREFIX + "VMFreezer.NumPhysicalWrites"], 522_305_536)
        self.assertEqual(swept["vellum.hwreport.wakeups"], 48_210)
        self.device.run("-f", day=TODAY + 1)
        scalars = self.device.log()["TBScalars"]
        self.assertEqual({key: scalars.get(key) for key in expected}, expected)

    def test_error_correction_events_reach_the_structured_log(self):
        self.device.run("-f")
        logs = list((self.device.root / "var/mobile/Library/Logs/StructuredData").glob("*-172.plist"))
        self.assertEqual(len(logs), 1)
        self.assertEqual(plistlib.loads(logs[0].read_bytes())["Records"],
                         [{"id": 3, "count": 2, "reg0": 0x1F40, "reg1": -1},
                          {"id": 4, "count": 1, "reg0": 0x2A00}])

    def test_a_bad_buffer_costs_the_storage_figures_only(self):
        path = self.device.root / BUFFER
        whole = path.read_bytes()
        for name, buffer in (("empty", b""), ("cut", whole[:-8]), ("7 bytes", whole[:7]),
                             ("count", whole[:4] + b"\xff" * 4 + whole[8:]),
                             ("key", b"\xff" * 4 + whole[4:])):
            with self.subTest(name):
                path.write_bytes(buffer)
                self.device.run("-f", day=TODAY + 2)
                swept = self.swept(TODAY + 2)
                self.assertFalse(any(key.startswith(PREFIX) for key in swept))
                self.assertIn("vellum.hwreport.wakeups", swept)

    def test_the_tool_shows_the_same_figures(self):
        exported = records((self.device.root / BUFFER).read_bytes())
        self.assertIn(f"{exported[7][0]:,}", self.device.tool("nand", "info"))
        self.assertIn("98 %", self.device.tool("nand", "health"))
        (self.device.root / "device/registry.plist").unlink()
        self.device.tool("nand", "info", status=1)
        self.device.tool("nand", "health", "--json", status=1)


if __name__ == "__main__":
    unittest.main()
