"""The libraries as other programs get them: installed below a prefix of their own."""
import pathlib
import re
import shutil
import sys
import tempfile
import unittest

from device import BIN, Device, checked

TOP = pathlib.Path(__file__).resolve().parent.parent.parent
BUILD = BIN.parent
SKIPPED = 77  # what ctest counts as skipped

SECONDS = 1 << 56
REGISTRY = {"Entries": [
    {"Class": "HwReportHub"},
    {"Class": "FanController", "Name": "fan", "ID": 0x10, "Properties": {
        "HwReportLegendPublic": True,
        "HwReportLegend": [{
            "HwReportGroupName": "Cooling",
            "HwReportChannelInfo": {"HwReportChannelUnit": SECONDS},
            "HwReportChannels": [[1, 0x101000001, "Turns"], [2, 0x200000002, "Mode"]]}],
        "HwReportValues": [
            {"Channel": 1, "Value": 1200},
            {"Channel": 2, "Value": [{"ID": "OFF", "InTransitions": 4, "Residency": 30},
                                     {"ID": "ON", "InTransitions": 5, "Residency": 10}]}]}}]}
COUNTERS = "fan <id 0x10>: Turns = 1200 s\nfan <id 0x10>: Mode[0] OFF = 30\nfan <id 0x10>: Mode[1] ON = 10\n"


@unittest.skipUnless((BUILD / "libhwreport.so").exists(), "built without shared libraries")
class Installed(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-library-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)
        cls.prefix = cls.folder / "prefix"
        for component in ("tallykv", "hwreport", "tallystorage", "tallyclient"):
            for part in (component, f"{component}-dev"):
                checked("cmake", "--install", BUILD, "--prefix", cls.prefix, "--component", part)
        cls.library = next(cls.prefix.glob("**/libhwreport.so")).parent

    def output(self, *command, root, status=0):
        """What a program prints that uses the libraries on a device."""
        return checked(*command, status=status, TALLYRUN_ROOT=str(root), LD_LIBRARY_PATH=str(self.library))

    # The examples that exist in several languages print the same.

    def check_counters(self, device, *program):
        """On a device with the registry above."""
        self.assertEqual(self.output(*program, root=device.root), COUNTERS)
        self.assertEqual(self.output(*program, 0, "Cooling", root=device.root), re.sub(r"= \d+", "= 0", COUNTERS))
        self.assertIn("not be subscribed", self.output(*program, 0, "none", root=device.root, status=1))
        self.assertIn("No such file", self.output(*program, root="/nonexistent", status=1))

    def check_health(self, *program):
        device = Device()
        self.addCleanup(device.remove)
        (device.root / "device/device.plist").unlink()
        for name, content in {"type": "MMC", "life_time": "0x03 0x02", "pre_eol_info": "0x01", "cid": "150100"}.items():
            device.write(f"sys/block/mmcblk0/device/{name}", content.encode() + b"\n")
        printed = self.output(*program, "mmcblk0", root=device.root).splitlines()
        self.assertEqual(printed[0], "disk mmcblk0: eMMC, says how worn it is")
        self.assertIn("vellum.NANDInfo.Health.MaxPercentageNANDUsed = 20", printed)
        self.assertRegex(printed[-1], r"^vellum\.NANDInfo\.ExportVersion = \d+$")
        self.assertFalse([line for line in printed if "E2E" in line], "which no eMMC counts")
        self.assertIn("no disk of that name", self.output(*program, "sda", root=device.root, status=1))


def main_with_optional_clients():
    """As unittest.main; exits with SKIPPED if nothing failed and a test had to be skipped."""
    result = unittest.main(exit=False).result
    sys.exit(1 if not result.wasSuccessful() else SKIPPED if result.skipped else 0)
