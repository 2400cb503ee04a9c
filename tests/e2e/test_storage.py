"""The sample storage of examples/device: what its driver exports reaches the log of the next day."""
import pathlib
import plistlib
import struct
import sys
import unittest

from device import DeviceTest, TODAY, checked, group

MAKE_STORAGE = pathlib.Path(__file__).resolve().parents[2] / "examples/device/make-storage.py"
BUFFER = "device/storage-statistics.bin"
PREFIX = "vellum.NANDInfo."
# Report names and the places of their values in the driver's buffer: key and element.
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
    def test_the_next_day_reports_what_the_driver_exported(self):
        device = self.device
        checked(sys.executable, MAKE_STORAGE, device.root, TODAY)
        device.whitelist(G=group(scalar_prefixes={"vellum.": {}}))
        buffer = (device.root / BUFFER).read_bytes()
        expected = {PREFIX + name: records(buffer)[key][element] for name, (key, element) in SPOTS.items()}
        expected |= {PREFIX + "VMFreezer.NumPhysicalWrites": 522_305_536, "vellum.hwreport.wakeups": 48_210}
        device.run("-f")
        log, = device.root.glob("var/mobile/Library/Logs/StructuredData/*-172.plist")
        self.assertEqual(plistlib.loads(log.read_bytes())["Records"],
                         [{"id": 3, "count": 2, "reg0": 0x1F40, "reg1": -1}, {"id": 4, "count": 1, "reg0": 0x2A00}])
        device.run("-f", day=TODAY + 1)
        scalars = device.log()["TBScalars"]
        self.assertEqual({key: scalars.get(key) for key in expected}, expected)
        self.assertIn("98 %", device.tool("nand", "health"))
        # A malformed buffer affects only the storage figures.
        (device.root / BUFFER).write_bytes(buffer[:-8])
        device.run("-f", day=TODAY + 2)
        swept = device.tool("store", "dump", "--day", str(TODAY + 2))
        self.assertNotIn(f",{PREFIX}", swept)
        self.assertIn(",vellum.hwreport.wakeups,", swept)

    def test_the_kernels_disk_is_reported_every_day(self):
        device = self.device
        (device.root / "device/device.plist").unlink()  # nor is there an analytics service then
        card = {"type": "MMC", "life_time": "0x03 0x02", "pre_eol_info": "0x01", "cid": "150100"}
        for day in (TODAY, TODAY + 1):
            for name, content in card.items():
                device.write(f"sys/block/mmcblk0/device/{name}", content.encode() + b"\n")
            device.run("-f", day=day)
            card["life_time"] = "0x03 0x04"
        used = f"{PREFIX}UserPartitionPEPercentUsed"
        self.assertEqual([device.tool("store", "dump", "--day", str(day)).split(f"{used},{day},,")[1].split()[0]
                          for day in (TODAY, TODAY + 1)], ["10", "30"])
        health = device.tool("nand", "health", day=TODAY + 1)
        self.assertIn("20-30 %", health)
        self.assertIn("1 of the 2 steps", health)


if __name__ == "__main__":
    unittest.main()
