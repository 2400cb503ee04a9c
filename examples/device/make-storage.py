#!/usr/bin/env python3
"""Adds a flash storage to a device root: make-storage.py ROOT DAY [SEED].

Writes a driver with every statistic that the program knows, a stackshot with the memory freezer's
thread, purgeable space and two error-correction events. DAY (days since 1970-01-01) is the day of
the first run: the boot session is chosen so that its figures are recorded on that day, and on every
other day after it. The same day and seed give the same device.
"""
import math
import pathlib
import plistlib
import random
import re
import struct
import sys

TABLE = pathlib.Path(__file__).resolve().parents[2] / "src/storage/statistics/counter_table.h"
SECONDS_PER_DAY = 86400

# What a storage of 32 GB shows after a year or so of use. What is not here is made up by its kind.
KNOWN = {
    "version": 7, "exportVersion": 0x20004, "bytesPerPage": 16384, "pagesPerVirtualBlock": 4608,
    "pagesPerVirtualBlockSlc": 1536, "blocksPerVirtualBlock": 8, "numVirtualBlocks": 476,
    "numFreeVirtualBlocks": 61, "hostReads": 4_120_889_113, "hostWrites": 1_377_204_518,
    "hostWritesDyn": 1_212_007_340, "hostWritesStatic": 165_197_178, "nandReads": 5_208_441_902,
    "nandWrites": 2_190_334_871, "bandErases": 41_882, "intermediateBandErases": 96_310,
    "wearLevMoves": 8_812, "IND_pool_free": 21_404, "IND_pool_count": 65_536,
    "numSleepOps": 181_204, "maxHighEnduranceBlockErases": 1_240, "boots": 213, "uncleanBoots": 4,
    "averageGracefulBootTimeMs": 744, "maxGracefulBootTimeMs": 1_312,
    "averageUngracefulBootTimeMs": 2_380, "maxUngracefulBootTimeMs": 5_906,
    "percentUsed": 9, "slcPercentUsed": 14, "fwUpdatesPercentUsed": 2,
    "spareAvailablePercent": 98, "numGrownBad": 3, "numFactoryBad": 27, "numPfail": 2,
    "numEfail": 1, "ueccReads": 0, "internalUeccs": 0, "raidSmartErrors": 0, "numDieFailures": 0,
    "userPartitionStart": 1_048_576, "intermediatePartitionStart": 131_072,
    "maxMemChokeDuration": 123_487, "maxMemLowDuration": 8_231, "powerOnHours": 9_310,
    "powerOnSeconds": 33_516_411, "staticSizeInMB": 9_120, "coldestCycle": 61, "hottestCycle": 118,
    "odtsCurrent": 31, "odtsMax": 58, "TempSensorMax": 58, "TempSensorMin": 2,
    "nandDesc": 0x31345342, "q7mFwVer": 1_402,
}
# Counters of what should not happen, and other small ones, by a word in their name.
RARE = re.compile(r"fail|err|uecc|abort|bork|mismatch|bitflip|defect|retired|unsupp|offline|crc|"
                  r"torn|dupes|exceeded|Backward|BackWard", re.IGNORECASE)
TEMPERATURE = re.compile(r"TempHisto|TmpHist")
DURATION = re.compile(r"duration|time|_us$|_ms$|Ms$", re.IGNORECASE)


def statistics():
    """(key, name, number of elements) of every statistic, by key. Some have several rows."""
    row = re.compile(r'\{(\d+), "(\w+)", (\d+), ')
    return sorted({(int(key), name, int(elements))
                   for key, name, elements in row.findall(TABLE.read_text())})


def bell(count, total, middle, dice):
    """A histogram of so many buckets around its middle (0 to 1)."""
    weights = [math.exp(-((i / max(count - 1, 1) - middle) * 5) ** 2) for i in range(count)]
    return [int(total * weight * dice.uniform(0.85, 1.15)) for weight in weights]


def values_of(name, count, day, dice):
    if name == "utilFormatTime":
        return [(day - 391) * SECONDS_PER_DAY + 34_211]
    if name in ("calendarTime", "wallTime"):
        return [day * SECONDS_PER_DAY + 30_000]
    if name in KNOWN:
        return [KNOWN[name] + i * 37 for i in range(count)]
    if TEMPERATURE.search(name):
        return bell(count, 400, 0.45, dice)
    if RARE.search(name):
        return [dice.choice((0, 0, 0, 0, 0, 1, 2)) for _ in range(count)]
    if "Histo" in name or "Bins" in name or count > 8:
        return bell(count, dice.randrange(500, 40_000), dice.uniform(0.1, 0.6), dice)
    size = 5 if DURATION.search(name) else 6
    return [int(10 ** dice.uniform(1, size)) for _ in range(count)]


def statistics_buffer(day, dice):
    """Records of key, count and 64-bit values, little endian."""
    buffer = b""
    for key, name, count in statistics():
        values = values_of(name, count, day, dice)
        buffer += struct.pack(f"<II{len(values)}Q", key, len(values), *values)
    return buffer


def item(kind, flags, payload=b""):
    return struct.pack("<IIQ", kind, len(payload), flags) + payload


def thread(number, name, io_counters):
    """A container with a thread's name and its I/O counters: reads and their bytes, then writes."""
    counters = struct.pack("<12Q", *io_counters, *[0] * (12 - len(io_counters)))
    return (item(0x13, number, struct.pack("<I", 2)) + item(0x909, 0, name.encode() + b"\0") +
            item(0x901, 0, counters) + item(0x14, number))


def stackshot():
    threads = (thread(0x101, "idle", (0, 0, 0, 0)) +
               thread(0x102, "VM_swapout", (12, 49_152, 31_877, 522_305_536)) +
               thread(0x103, "VM_compressor", (4, 16_384, 0, 0)))
    task = item(0x13, 0, struct.pack("<I", 1)) + threads + item(0x14, 0)
    return task + item(0xF19158ED, 0)


def ecc_event(number, registers):
    return struct.pack("<BB6x8q", number, len(registers), *registers, *[0] * (8 - len(registers)))


def boot_session(day, dice):
    """On a day whose parity is that of the first digit the figures go to analytics instead."""
    first = "0" if day % 2 else "1"
    rest = "".join(dice.choice("0123456789ABCDEF") for _ in range(31))
    digits = first + rest
    return "-".join((digits[:8], digits[8:12], digits[12:16], digits[16:20], digits[20:]))


def channel_driver():
    """A driver that publishes statistics channels: format 1 (simple), category 0x100, one element."""
    simple = 1 | 0x100 << 16 | 1 << 32
    channels = {"PERF": ("cpu-performance-cycles", 88_120_442_118),
                "EFFI": ("cpu-efficiency-cycles", 301_774_902_336),
                "DISP": ("display-frames", 4_182_201), "WAKE": ("wakeups", 48_210)}
    ids = {name: int.from_bytes(name.encode(), "big") for name in channels}
    legend = [{"HwReportGroupName": "Activity",
               "HwReportChannels": [[ids[name], simple, label]
                                    for name, (label, _) in channels.items()]}]
    return {"Class": "ActivityCounters", "Name": "activity-counters",
            "Properties": {"HwReportLegendPublic": True, "HwReportLegend": legend,
                           "HwReportValues": [{"Channel": ids[name], "Value": value}
                                              for name, (_, value) in channels.items()]}}


def storage_driver():
    """Answers the statistics fetch from a file, and the content-deletion query with no."""
    methods = [{"Method": 8, "Selector": 13, "Data": "storage-statistics.bin"},
               {"Method": 5, "Data": bytes(4)}]
    return {"Class": "SPXStorage", "Name": "flash-storage",
            "Properties": {"Device Characteristics": {"Vendor Name": "Sample", "Capacity": 32}},
            "UserClient": {"Methods": methods}}


def load(path, empty):
    return plistlib.loads(path.read_bytes()) if path.exists() else empty


def main():
    if len(sys.argv) not in (3, 4):
        sys.exit(__doc__)
    device = pathlib.Path(sys.argv[1]) / "device"
    day = int(sys.argv[2])
    dice = random.Random(f"{sys.argv[3] if len(sys.argv) == 4 else ''}{day}")
    device.mkdir(parents=True, exist_ok=True)
    (device / "storage-statistics.bin").write_bytes(statistics_buffer(day, dice))
    (device / "stackshot.kcdata").write_bytes(stackshot())

    description = load(device / "device.plist", {})
    description["Stackshot"] = {"File": "stackshot.kcdata"}
    description["PurgeableSpace"] = {"RECLAIM_TOTAL_AVAILABLE": 3_221_225_472,
                                     "RECLAIM_NONPURGEABLE_AMOUNT": 8_375_025_664}
    description.setdefault("KernelValues", {}).update({
        "kern.bootsessionuuid": boot_session(day, dice).encode(),
        "kern.next_ecc_event": [ecc_event(3, (0x1F40, -1)), ecc_event(4, (0x2A00,))]})
    (device / "device.plist").write_bytes(plistlib.dumps(description, sort_keys=False))

    registry = load(device / "registry.plist", {"Entries": []})
    if not any(entry.get("Class") == "HwReportHub" for entry in registry["Entries"]):
        registry["Entries"].append({"Class": "HwReportHub"})
    registry["Entries"] += [storage_driver(), channel_driver()]
    (device / "registry.plist").write_bytes(plistlib.dumps(registry, sort_keys=False))


if __name__ == "__main__":
    main()
