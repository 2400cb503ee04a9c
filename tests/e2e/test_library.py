"""The libraries as other programs get them: installed, found, built against and run."""
import pathlib
import re
import shutil
import sys
import tempfile
import unittest

from device import BIN, Device, checked

TOP = pathlib.Path(__file__).resolve().parent.parent.parent
BUILD = BIN.parent

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
EXPECTED = (
    "fan <id 0x10> Turns < 0x1 (s) | G/g Cooling/(none) | cat 0x100 | format 0x01 | elts 1 >\n"
    "                             Turns = {         1200 s }\n"
    "fan <id 0x10> Mode < 0x2 (s) | G/g Cooling/(none) | cat 0000 | format 0x02 | elts 2 >\n"
    "                  Mode[     OFF] = { # 4        3.000e+01 s / 75.0% }\n"
    "                  Mode[      ON] = { # 5        1.000e+01 s / 25.0% }\n")

@unittest.skipUnless((BUILD / "libhwreport.so").exists(), "built without shared libraries")
class Library(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-library-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)
        cls.prefix = cls.folder / "prefix"
        for component in ("tallykv", "hwreport", "tallystorage"):
            for part in (component, f"{component}-dev"):
                checked("cmake", "--install", BUILD, "--prefix", cls.prefix, "--component", part)
        cls.library = next(cls.prefix.glob("**/libhwreport.so")).parent

    def built(self, example, source, library):
        """A folder of the example's programs as CMake builds them, and the one of a source by pkg-config."""
        folder = self.folder / example
        checked("cmake", "-S", TOP / "examples" / example, "-B", folder, f"-DCMAKE_PREFIX_PATH={self.prefix}")
        checked("cmake", "--build", folder)
        flags = checked("pkg-config", "--cflags", "--libs", library,
                        PKG_CONFIG_PATH=str(self.library / "pkgconfig")).split()
        program = folder / "by-pkg-config"
        checked("g++", "-std=c++20", TOP / "examples" / example / source, "-o", program, *flags)
        return folder, program

    def test_channels_example(self):
        folder, program = self.built("hwreport", "channels.cpp", "hwreport")
        device = Device()
        self.addCleanup(device.remove)
        device.write("device/registry.plist", REGISTRY)
        for channels in (folder / "channels", program):
            output = checked(channels, TALLYRUN_ROOT=f"{device.root}/", LD_LIBRARY_PATH=str(self.library))
            self.assertEqual(output, EXPECTED)
        self.assertEqual(checked(folder / "delta", TALLYRUN_ROOT=str(device.root)), "Turns 0\n")
        # A device without a hub or channels is an answer, not a crash.
        checked(folder / "channels", status=0x11, TALLYRUN_ROOT=str(self.folder))

    def test_storage_example(self):
        device = self.folder / "storage-root"
        checked(sys.executable, TOP / "examples/device/make-storage.py", device, "20514")
        folder, program = self.built("storage", "wear.cpp", "tallystorage")
        for example in (folder / "wear", program):
            found = {"LD_LIBRARY_PATH": str(self.library)}
            self.assertEqual(checked(example, TALLYRUN_ROOT=str(device), **found), "9 % used\n")
            errors = checked(example, status=1, TALLYRUN_ROOT=str(self.folder), **found)
            self.assertIn("Unable to parse buffer", errors)

    def test_only_what_is_declared_is_exported(self):
        declared = set(re.findall(r"TALLY_API[^;{(=]*?(\w+)[(;]", "".join(
            header.read_text() for folder in ("hwreport", "storage")
            for header in (self.prefix / "include" / folder).iterdir())))
        self.assertGreater(len(declared), 85)
        exported = {name: set(re.findall(r"^\w+ \w (?:tally::)?(.*)", checked(
            "nm", "-DC", "--defined-only", self.library / f"lib{name}.so"), re.M))
                    for name in ("hwreport", "tallystorage", "tallykv")}
        names = {re.split(r"[(\[]", symbol)[0] for symbol in exported["hwreport"] | exported["tallystorage"]}
        # Beyond the functions only members of the public classes.
        self.assertEqual({name for name in declared ^ names
                          if not re.match("HwReport(Error|Subscription)::", name)}, set())
        for symbol in exported["tallykv"]:
            self.assertRegex(symbol, r"^[Kk]v[A-Z]")

    def test_each_public_header_compiles_alone(self):
        headers = sorted((self.prefix / "include").glob("**/*.h"))
        self.assertGreater(len(headers), 8)
        for header in headers:
            checked("g++", "-std=c++20", "-fsyntax-only", "-Wall", "-Wextra", "-Wpedantic", "-Werror",
                    f"-I{self.prefix}/include", "-x", "c++", "-include", header, "/dev/null")

if __name__ == "__main__":
    unittest.main()
