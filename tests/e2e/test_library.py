"""The libraries as other programs get them: installed, found, built against and run."""
import re
import socket
import sys
import unittest

from device import Device, checked
from installed import REGISTRY, TOP, Installed

EXPECTED = (
    "fan <id 0x10> Turns < 0x1 (s) | G/g Cooling/(none) | cat 0x100 | format 0x01 | elts 1 >\n"
    "                             Turns = {         1200 s }\n"
    "fan <id 0x10> Mode < 0x2 (s) | G/g Cooling/(none) | cat 0000 | format 0x02 | elts 2 >\n"
    "                  Mode[     OFF] = { # 4        3.000e+01 s / 75.0% }\n"
    "                  Mode[      ON] = { # 5        1.000e+01 s / 25.0% }\n")

RECORDED = ("com.example.pump.temperature:0|g\ncom.example.pump.temperature:-4|g\ncom.example.pump.starts:1|c\n"
            "com.example.pump.pressure:1.8|h\ncom.example.pump.wait:12.5:0.75:3|h\n")


class Library(Installed):
    def built(self, example, source, library, *compiler):
        """A folder of the example's programs as CMake builds them, and the one of a source by pkg-config."""
        folder = self.folder / example
        checked("cmake", "-S", TOP / "examples" / example, "-B", folder, f"-DCMAKE_PREFIX_PATH={self.prefix}")
        checked("cmake", "--build", folder)
        flags = checked("pkg-config", "--cflags", "--libs", library,
                        PKG_CONFIG_PATH=str(self.library / "pkgconfig")).split()
        program = folder / "by-pkg-config"
        compiler = compiler or ("g++", "-std=c++20")
        checked(*compiler, TOP / "examples" / example / source, "-o", program, *flags)
        return folder, program

    def test_channels_example(self):
        folder, program = self.built("hwreport", "channels.cpp", "hwreport")
        device = Device()
        self.addCleanup(device.remove)
        device.write("device/registry.plist", REGISTRY)
        for channels in (folder / "channels", program):
            self.assertEqual(self.output(channels, root=f"{device.root}/"), EXPECTED)
        self.assertEqual(checked(folder / "delta", TALLYRUN_ROOT=str(device.root)), "Turns 0\n")
        self.check_counters(device, folder / "counters")
        self.check_counters(device, sys.executable, TOP / "examples/hwreport/counters.py")
        # A device without a hub or channels is an answer, not a crash.
        checked(folder / "channels", status=0x11, TALLYRUN_ROOT=str(self.folder))

    def test_storage_example(self):
        device = self.folder / "storage-root"
        checked(sys.executable, TOP / "examples/device/make-storage.py", device, "20514")
        folder, program = self.built("storage", "wear.cpp", "tallystorage")
        for example in (folder / "wear", program):
            self.assertEqual(self.output(example, root=device), "9 % used\n")
            errors = self.output(example, root=self.folder, status=1)
            self.assertIn("Unable to parse buffer", errors)
        self.check_health(folder / "health")
        self.check_health(sys.executable, TOP / "examples/storage/health.py")

    def test_client_examples(self):
        folder, program = self.built("client", "record.c", "tallyclient",
                                     "gcc", "-std=c99", "-pedantic-errors", "-Wall", "-Wextra", "-Werror")
        path = str(self.folder / "statsd.sock")
        found = {"LD_LIBRARY_PATH": str(self.library), "TALLYCLIENT_SOCKET": path}
        script = TOP / "examples/client/record.py"
        errors = checked(sys.executable, script, status=1, **found)
        self.assertEqual(errors, "not recorded: No such file or directory\n")
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as daemon:
            daemon.bind(path)
            for example in ([folder / "record"], [program], [sys.executable, script]):
                checked(*example, **found)
                self.assertEqual(daemon.recv(8192, socket.MSG_DONTWAIT).decode(), RECORDED)

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
        header = (self.prefix / "include/tallyclient/tallyclient.h").read_text()
        self.assertEqual(set(re.findall(r"^TALLYCLIENT_API [^(]*?(\w+)\(", header, re.M)),
                         set(re.findall(r"^\w+ \w (.*)", checked(
                             "nm", "-D", "--defined-only", self.library / "libtallyclient.so"), re.M)))
        for symbol in exported["tallykv"]:
            self.assertRegex(symbol, r"^[Kk]v[A-Z]")

    def test_each_public_header_compiles_alone(self):
        headers = sorted((self.prefix / "include").glob("**/*.h"))
        self.assertGreater(len(headers), 8)
        for header in headers:
            checked("g++", "-std=c++20", "-fsyntax-only", "-Wall", "-Wextra", "-Wpedantic", "-Werror",
                    f"-I{self.prefix}/include", "-x", "c++", "-include", header, "/dev/null")
            if header.stem.endswith("_c"):
                checked("gcc", "-std=c99", "-fsyntax-only", "-Wall", "-Wextra", "-Wpedantic", "-Werror",
                        f"-I{self.prefix}/include", "-x", "c", "-include", header, "/dev/null")


if __name__ == "__main__":
    unittest.main()
