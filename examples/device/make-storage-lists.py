#!/usr/bin/env python3
"""Gives a device's flash storage its lists: make-storage-lists.py ROOT [CONTROLLER [PARTS]].

Adds validity, telemetry and defects lists to the storage driver that make-storage.py wrote. The
CONTROLLER is spx (unless given) or nvme; PARTS is a generation of parts: 0, 0a or 0b for the oldest
one and its two other makes, 1, or 2 (unless given).
"""
import pathlib
import plistlib
import random
import struct
import sys

BUSES = 4
BLOCK_WORDS = 1024
# Class, key of the characteristics, and the method by which everything is fetched.
CONTROLLERS = {"spx": ("SPXStorage", "Device Characteristics", 8),
               "nvme": ("OrreryEmbeddedNVMeController", "Controller Characteristics", 9)}
# Chip, make of the flash, and the words of a bus's block that hold counters.
PARTS = {"0": ("Q5M", "98DEA4827AB3", range(256, 396)),
         "0a": ("Q5M", "4582603A57FF", range(256, 316)),
         "0b": ("Q5M", "AD82522321FF", range(256, 312)),
         "1": ("Q7M", "4582983E76F1", range(0, 121)),
         "2": ("Q9M", "4582983E76F1", range(0, 127))}
BAND_STATISTICS, DEFECTS, TELEMETRY, STATISTICS = 11, 15, 17, 13


def words(*values):
    return struct.pack(f"<{len(values)}I", *(value & 0xFFFFFFFF for value in values))


def validity_list(dice):
    """Sectors that are still valid in the bands of six lists."""
    records = [(index, dice.randrange(0, 9_216)) for index in (0, 1, 2, 3, 8, 15) for _ in range(12)]
    records.append((16, 1))  # of a list that is never reported
    entries = [(i, 0) for i in range(3)]
    return (words(len(records), len(entries), 0) + b"".join(words(*entry) for entry in entries) +
            b"".join(words(index, value, 0, 0, 0) for index, value in records))


def telemetry_list(mode, used, dice):
    """A block of counters for each bus, most reads in the first stages, and a summary for each."""
    blocks = summaries = b""
    for bus in range(BUSES):
        block = [0] * BLOCK_WORDS
        for place, word in enumerate(used):
            block[word] = int(10 ** dice.uniform(0, max(0.5, 6 - place % 23 / 3)))
        blocks += words(*block)
        summaries += words(dice.randrange(1_000, 90_000), dice.randrange(40, 120), 131, -3 - bus,
                           dice.randrange(0, 400), mode, 1_152, 0)
    return blocks + summaries


def defects_list(dice):
    """Defects since the factory's 27, one for each way in which a reason is told."""
    defects = []
    for mode in (0, 1, 2, 0):
        defects.append(words(dice.randrange(BUSES) | dice.randrange(2) << 16, dice.randrange(2),
                             dice.randrange(2_048), dice.randrange(40, 120),
                             dice.choice((3, 17, 21)), dice.randrange(576),
                             dice.randrange(-5, 60) & 0xFF, mode))
    return words(0, 27, len(defects)) + b"".join(defects)


def lists_of(used, dice):
    """File names, contents, and which request each one answers: selector and flags."""
    yield "storage-validity.bin", validity_list(dice), {"Selector": BAND_STATISTICS}
    for mode in range(3):
        yield (f"storage-telemetry-{mode}.bin", telemetry_list(mode, used, dice),
               {"Selector": TELEMETRY, "Flags": mode << 2})
    yield "storage-defects.bin", defects_list(dice), {"Selector": DEFECTS}


def main():
    if len(sys.argv) not in (2, 3, 4):
        sys.exit(__doc__)
    device = pathlib.Path(sys.argv[1]) / "device"
    class_name, characteristics, method = CONTROLLERS[(sys.argv[2:] + ["spx"])[0]]
    chip, manufacturer, used = PARTS[(sys.argv[3:] + ["2"])[0]]
    dice = random.Random(f"{class_name} {chip} {manufacturer}")

    registry = plistlib.loads((device / "registry.plist").read_bytes())
    classes = {name for name, _, _ in CONTROLLERS.values()}
    driver = next(entry for entry in registry["Entries"] if entry["Class"] in classes)
    driver["Class"] = class_name
    driver["Properties"] = {characteristics: {
        "chip-id": chip, "manufacturer-id": manufacturer, "num-bus": BUSES,
        "nand-device-desc": 0x31345342, "Vendor Name": "Sample", "Capacity": 32}}
    # The statistics stay; the newer controller has no content-deletion query.
    answers = [dict(answer, Method=method) if "Selector" in answer else answer
               for answer in driver["UserClient"]["Methods"]
               if answer.get("Selector") == STATISTICS or
               ("Selector" not in answer and class_name == "SPXStorage")]
    for name, content, request in lists_of(used, dice):
        (device / name).write_bytes(content)
        answers.append({"Method": method, **request, "Data": name})
    driver["UserClient"]["Methods"] = answers
    (device / "registry.plist").write_bytes(plistlib.dumps(registry, sort_keys=False))
    # Its write amplification is low; with the usual threshold there would be no storage log.
    preferences = device.parent / "var/mobile/Library/Preferences/vellum.NANDInfo.plist"
    preferences.parent.mkdir(parents=True, exist_ok=True)
    preferences.write_bytes(plistlib.dumps({"userWAmp": 0.5}))


if __name__ == "__main__":
    main()
