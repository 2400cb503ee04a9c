#!/usr/bin/env python3
"""make-snapshot.py FOLDER: the sample device's snapshot buffers.

snapshot.bin holds records of the fixed layout, snapshot-described.bin shorter ones that
snapshot-header.bin describes; both tell of a night: idle, a backup at two o'clock, idle again.
"""
import pathlib
import random
import struct
import sys

RECORDS = 24
FIRST_TIME = 21 * 3600


def priorities(rng, operations):
    words = []
    for share in (0.7, 0.2, 0.08, 0.02):
        count = int(operations * share)
        total = count * rng.randint(80, 140)
        words += [count, total, min(total, rng.randint(200, 9000)) if count else 0]
    return words


def fixed_record(rng, hour):
    busy = 40 if hour % 24 == 2 else 1
    words = [0] * 63
    words[0] = FIRST_TIME + hour * 3600
    words[1] = rng.randint(0, 3 * min(busy, 20))
    words[2:14] = priorities(rng, 90 * busy)
    words[14:26] = priorities(rng, 210 * busy)
    words[26] = rng.randint(0, busy)
    words[27:31] = [rng.randint(100, 400) * busy for _ in range(4)]
    words[31] = rng.randint(0, 50) * busy
    words[33] = rng.randint(0, 2)
    words[36:38] = [rng.randint(2, 9), rng.randint(10, 40)]
    words[39] = rng.randint(0, 90000) * busy
    words[40:46] = [0, rng.randint(0, 2) * busy, rng.randint(900, 1200), rng.randint(0, 40),
                    100, rng.randint(20000, 30000)]
    words[47:49] = [rng.randint(0, 12), 64]
    words[50:55] = [rng.randint(0, 4), 0, rng.randint(0, 5000), 0, rng.randint(1, 31)]
    return struct.pack("<63I", *words)


def description(records):
    fields = [(0, 0, 4, "T=%04u"), (1, 4, 4, " HR=%4u"), (1, 8, 4, " HW=%4u"), (2, 12, 4, " TH=%6u"),
              (3, 16, 48, " R%s=")]
    title = b"sample storage processor, one record an hour\0"
    table = (32 + len(title) + 3) // 4 * 4
    block = struct.pack("<IIIIQII", 0, 6, 64, records + 1, 0, table, 0) + title
    block = block.ljust(table, b"\0") + struct.pack("<II", len(fields), 0)
    for kind, offset, size, label in fields:
        block += struct.pack("<HHII16s", kind, 0, offset, size, label.encode())
    return block


def described_record(fixed):
    words = struct.unpack("<63I", fixed)
    return struct.pack("<16I", words[0], words[27], words[28], words[39], *words[14:26])


def main():
    folder = pathlib.Path(sys.argv[1])
    folder.mkdir(parents=True, exist_ok=True)
    rng = random.Random(22)
    fixed = [fixed_record(rng, 21 + i) for i in range(RECORDS)]
    (folder / "snapshot.bin").write_bytes(b"".join(fixed))
    (folder / "snapshot-described.bin").write_bytes(b"".join(map(described_record, fixed)))
    (folder / "snapshot-header.bin").write_bytes(description(RECORDS))


if __name__ == "__main__":
    main()
