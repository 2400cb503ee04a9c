"""The libraries as other programs get them: installed, found, built against and run."""
import os
import pathlib
import plistlib
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

TOP = pathlib.Path(__file__).resolve().parent.parent.parent
BUILD = pathlib.Path(os.environ["TALLYRUN_BIN"]).parent

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

def run(*command, **environment):
    return subprocess.run([str(part) for part in command], env={**os.environ, **environment},
                          capture_output=True, text=True, timeout=200)

@unittest.skipUnless((BUILD / "libhwreport.so").exists(), "built without shared libraries")
class Library(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-library-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)
        cls.prefix = cls.folder / "prefix"
        for component in ("tallykv", "hwreport", "tallystorage"):
            for part in (component, f"{component}-dev"):
                cls.check(run("cmake", "--install", BUILD, "--prefix", cls.prefix,
                              "--component", part))
        cls.library = next(cls.prefix.glob("**/libhwreport.so")).parent
        cls.device = cls.folder / "root"
        (cls.device / "device").mkdir(parents=True)
        (cls.device / "device/registry.plist").write_bytes(plistlib.dumps(REGISTRY))

    @staticmethod
    def check(result):
        if result.returncode != 0:
            raise AssertionError(f"{result.args}: {result.returncode}\n{result.stdout}{result.stderr}")
        return result.stdout

    def built(self, example, source, library):
        """A folder of the example's programs as CMake builds them, and the one of a source by pkg-config."""
        folder = self.folder / example
        self.check(run("cmake", "-S", TOP / "examples" / example, "-B", folder,
                       f"-DCMAKE_PREFIX_PATH={self.prefix}"))
        self.check(run("cmake", "--build", folder))
        flags = self.check(run("pkg-config", "--cflags", "--libs", library,
                               PKG_CONFIG_PATH=str(self.library / "pkgconfig"))).split()
        program = folder / "by-pkg-config"
        self.check(run("g++", "-std=c++20", TOP / "examples" / example / source, "-o", program, *flags))
        return folder, program

    def test_channels_example(self):
        folder, program = self.built("hwreport", "channels.cpp", "hwreport")
        for channels in (folder / "channels", program):
            output = self.check(run(channels, TALLYRUN_ROOT=str(self.device) + "/", LD_LIBRARY_PATH=str(self.library)))
            self.assertEqual(output, EXPECTED)
        self.assertEqual(self.check(run(folder / "delta", TALLYRUN_ROOT=str(self.device))), "Turns 0\n")
        self.assertEqual(run(folder / "delta", TALLYRUN_ROOT=str(self.folder)).returncode, 1)
        # A device without a hub or channels is an answer, not a crash.
        self.assertEqual(run(folder / "channels", TALLYRUN_ROOT=str(self.folder)).returncode, 0x11)

    def test_storage_example(self):
        device = self.folder / "storage-root"
        self.check(run(sys.executable, TOP / "examples/device/make-storage.py", device, "20514"))
        folder, program = self.built("storage", "wear.cpp", "tallystorage")
        for example in (folder / "wear", program):
            found = {"LD_LIBRARY_PATH": str(self.library)}
            self.assertEqual(self.check(run(example, TALLYRUN_ROOT=str(device), **found)), "9 % used\n")
            result = run(example, TALLYRUN_ROOT=str(self.folder), **found)
            self.assertEqual(result.returncode, 1)
            self.assertIn("Unable to parse buffer", result.stderr)

    def test_only_what_is_declared_is_exported(self):
        declared = set(re.findall(r"TALLY_API[^;{(=]*?(\w+)[(;]", "".join(
            header.read_text() for folder in ("hwreport", "storage")
            for header in (self.prefix / "include" / folder).iterdir())))
        self.assertGreater(len(declared), 85)
        exported = {name: {line.split(" ", 2)[2].removeprefix("tally::") for line in self.check(
            run("nm", "-DC", "--defined-only", self.library / f"lib{name}.so")).splitlines()}
                    for name in ("hwreport", "tallystorage", "tallykv")}
        names = {re.split(r"[(\[]", symbol)[0] for symbol in exported["hwreport"] | exported["tallystorage"]}
        # Beyond the functions only members of the public classes.
        self.assertEqual({name for name in declared ^ names
                          if not re.match("HwReport(Error|Subscription)::", name)}, set())
        for symbol in exported["tallykv"]:
            self.assertRegex(symbol, r"^[Kk]v[A-Z]")
        self.assertRegex((self.library / "libhwreport.so.0").resolve().name, r"^libhwreport\.so\.0\.")

    def test_each_public_header_compiles_alone(self):
        headers = sorted((self.prefix / "include").glob("**/*.h"))
        self.assertGreater(len(headers), 8)
        for header in headers:
            self.check(run("g++", "-std=c++20", "-fsyntax-only", "-Wall", "-Wextra", "-Wpedantic",
                           "-Werror", f"-I{self.prefix}/include", "-x", "c++", "-include", header,
                           "/dev/null"))

if __name__ == "__main__":
    unittest.main()
