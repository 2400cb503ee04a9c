"""Builds for another processor: what the programs make of the sample device, beside the native build's,
byte for byte, on three days of which the last is after 2038."""
import os
import pathlib
import plistlib
import re
import shutil
import subprocess
import tempfile
import unittest

from device import BIN, Device, STORE, TODAY

TOP = pathlib.Path(__file__).resolve().parents[2]
NATIVE = pathlib.Path(os.environ["TALLYRUN_NATIVE_BIN"])
DAYS = (TODAY, TODAY + 1, 30000)  # 30000 is 2052-02-20
COMMANDS = (
    ["tallyrun", "-f"], ["tallyrun", "-t"],  # the second reports what the first swept
    *(["tallyctl", *words.split()] for words in (
        "store dump", "report show", "report preview", "explain vellum.power.wakeups", "whitelist check",
        "nand info --json", "nand health", "nand events", "channels sample --json",
        "nand snapshot DEVICE/snapshot.bin",
        "nand snapshot DEVICE/snapshot-described.bin --header DEVICE/snapshot-header.bin")))
# What depends on the machine and the time.
PINNED = {"MonotonicTicks": 86_400_000_000_000, "Timebase": {"Numerator": 1, "Denominator": 1},
          "OSVersion": "5.1 (16S46)", "SystemID": "Vellum 5.1", "HardwareModel": "sample"}
RANDOM = re.compile(rb"[0-9A-F]{8}(-[0-9A-F]{4}){3}-[0-9A-F]{12}|tallyrun\[\d+\]|"  # of each storage log
                    rb"<key>DevicePseudonym</key>\s*<string>[0-9a-f]{32}")


def life(root, programs):
    """What the programs in a folder say and leave on the sample device, by name."""
    subprocess.run([TOP / "scripts/make-demo-root", root, str(TODAY)], check=True, capture_output=True,
                   env={**os.environ, "TALLYRUN_BIN": str(programs)})
    description = root / "device/device.plist"
    description.write_bytes(plistlib.dumps({**plistlib.loads(description.read_bytes()), **PINNED}))
    (root / "etc").mkdir(exist_ok=True)
    (root / "etc/machine-id").write_text("0123456789abcdef" * 2 + "\n")
    found = {}
    os.truncate(root / STORE, 3 << 30)  # more than a 32-bit offset reaches; what is added is a hole
    for day in DAYS:
        environment = Device(root).environment(day)
        environment["FAKETIME"] = environment["FAKETIME"].lstrip("@")  # the clock stands still
        for program, *arguments in COMMANDS:
            result = subprocess.run(
                [programs / program, *(word.replace("DEVICE", f"{root}/device") for word in arguments)],
                capture_output=True, timeout=120, env=environment)
            found[f"day {day}: {program} {' '.join(arguments)}"] = (
                result.returncode, result.stdout, result.stderr)
    for path in sorted(root.rglob("*")):
        # The store's pages may differ with the version of SQLite; its rows are dumped above.
        if path.is_file() and "TBDataStore" not in path.name:
            found[str(path.relative_to(root))] = RANDOM.sub(b"", path.read_bytes())
    return found


class SameAsNative(unittest.TestCase):
    maxDiff = 2000

    def test_three_days_of_the_sample_device(self):
        folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-same-"))
        self.addCleanup(shutil.rmtree, folder, ignore_errors=True)
        native = life(folder / "device", NATIVE)
        (folder / "device").rename(folder / "native")  # so that paths in messages are the same
        other = life(folder / "device", BIN)
        self.assertEqual(sorted(native), sorted(other))
        logs = [name for name in native if name.endswith("-log-tallyd.log")]
        self.assertGreater(len(logs), len(DAYS))
        for name, content in native.items():
            with self.subTest(name):
                self.assertEqual(content, other[name])


if __name__ == "__main__":
    unittest.main()
