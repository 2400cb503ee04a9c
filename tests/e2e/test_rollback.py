"""A system that is rolled back: this version writes a store of the former format so that the former version
can go on with it, and keeps a store of a newer version for that one."""
import contextlib
import socket
import sqlite3
import struct
import unittest

from device import STORE, TODAY, DeviceTest, group
from recorder import RecordingDevice

APPLICATION, FORMER = 0x54424453, 1
RAW = """(
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL, samples INTEGER NOT NULL,
  sample_values BLOB NOT NULL, sample_offsets BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID"""
REQUIRED = {"scalars": """(
  day INTEGER NOT NULL, key TEXT NOT NULL, value INTEGER NOT NULL,
  PRIMARY KEY(day, key)) WITHOUT ROWID""", "chunks": RAW, "recent": RAW}
# What the former version accepts besides, to the letter.
ACCEPTED = {**REQUIRED, "counters": """(
  key TEXT NOT NULL PRIMARY KEY, epoch TEXT NOT NULL, last INTEGER NOT NULL, sum INTEGER NOT NULL,
  day INTEGER NOT NULL, amount INTEGER) WITHOUT ROWID""", "wear": """(
  disk TEXT NOT NULL, day INTEGER NOT NULL, least INTEGER NOT NULL, most INTEGER,
  host_bytes INTEGER, flash_bytes INTEGER,
  PRIMARY KEY(disk, day)) WITHOUT ROWID""", "arrivals": """(
  number INTEGER PRIMARY KEY, day INTEGER NOT NULL, key TEXT NOT NULL,
  samples INTEGER NOT NULL, weight INTEGER NOT NULL, data BLOB NOT NULL)""", "packed": """(
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL,
  samples INTEGER NOT NULL, weight INTEGER NOT NULL, data BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID""", "owners": """(
  day INTEGER NOT NULL, key TEXT NOT NULL, user INTEGER NOT NULL, distribution INTEGER NOT NULL,
  PRIMARY KEY(day, key)) WITHOUT ROWID""", "undated": """(
  number INTEGER PRIMARY KEY, boot TEXT NOT NULL, seconds INTEGER NOT NULL, kind INTEGER NOT NULL,
  key TEXT NOT NULL, value INTEGER NOT NULL, data BLOB, user INTEGER NOT NULL,
  first_day INTEGER)"""}


class Rollback(DeviceTest):
    def database(self, device):
        return contextlib.closing(sqlite3.connect(device.root / STORE, isolation_level=None))

    def make_former(self, device, day):
        (device.root / STORE).parent.mkdir(parents=True, exist_ok=True)
        with self.database(device) as store:
            store.execute("PRAGMA page_size = 8192")
            store.execute("PRAGMA journal_mode = WAL")
            for name, columns in REQUIRED.items():
                store.execute(f"CREATE TABLE {name}{columns}")
            store.execute(f"PRAGMA application_id = {APPLICATION}")
            store.execute(f"PRAGMA user_version = {FORMER}")
            store.execute("INSERT INTO scalars VALUES (?, 'a', 1)", (day,))
            for table, values in (("chunks", (1.5, 2.5)), ("recent", (3.5,))):
                store.execute(f"INSERT INTO {table} VALUES (?, 'd', 0, ?, ?, ?)",
                              (day, len(values), struct.pack(f"<{len(values)}d", *values), bytes(4 * len(values))))

    def test_the_former_version_can_go_on(self):
        device = RecordingDevice()
        self.addCleanup(device.remove)
        day = device.today
        self.make_former(device, day - 1)
        device.whitelist(G=group({"a": {}, "b": {}}, {"d": {}}))
        device.tool("store", "push", "d", "4.5", "--day", str(day - 1))
        device.tool("store", "import", "-", stdin=f"distribution,d,{day - 1},0,5.5,2\nscalar,b,{day - 1},,2\n".encode())
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as client:
            client.sendto(b"a:1|c\nd:6.5|ms", device.socket("statsd.sock"))
        device.commit()
        device.run("-f", day=day)
        log = device.log()
        self.assertEqual((log["TBScalars"]["a"], log["TBScalars"]["b"]), (2, 2))
        self.assertEqual(log["TBDistributions"]["d"][-1], 7)
        with self.database(device) as store:
            self.assertEqual(store.execute("PRAGMA user_version").fetchone(), (FORMER,))
            self.assertEqual(store.execute("PRAGMA application_id").fetchone(), (APPLICATION,))
            tables = dict(store.execute("SELECT name, sql FROM sqlite_schema"))
            self.assertLessEqual(tables.items(), {name: f"CREATE TABLE {name}{columns}"
                                                  for name, columns in ACCEPTED.items()}.items())
            self.assertLessEqual(set(REQUIRED), set(tables))
        self.assertEqual(device.preferences()["StoreConversionDays"], {"last": day, "days": 1})
        device.tool("prefs", "set", "StoreConversion", "at once")
        device.run("-f", day=day)
        with self.database(device) as store:
            self.assertGreater(store.execute("PRAGMA user_version").fetchone(), (FORMER,))
        self.assertEqual([log["TBScalars"], log["TBDistributions"]],
                         [device.logs()[-1][part] for part in ("TBScalars", "TBDistributions")])
        self.assertNotIn("StoreConversionDays", device.preferences())

    def test_a_newer_store_is_kept_and_read_again(self):
        device = self.device
        device.fill()
        with self.database(device) as store:
            version = store.execute("PRAGMA user_version").fetchone()[0]
            store.execute("PRAGMA user_version = 999")
        device.tool("store", "keys", status=1)
        messages = device.run("-f")
        self.assertEqual(sum("newer-1" in text for _, text in messages), 1, messages)
        self.assertIn("newer-1", device.tool("store", "keys"))
        aside = (device.root / STORE).with_name("TBDataStore.sqlitedb.newer-1")
        with contextlib.closing(sqlite3.connect(aside)) as store:  # as if this were the newer version
            store.execute(f"PRAGMA user_version = {version}")
        rows = device.tool("store", "dump", "--aside", "1")
        self.assertIn(f"scalar,a,{TODAY},,{TODAY}", rows)
        device.tool("store", "import", "-", stdin=rows.encode())
        self.assertIn(f"scalar,a,{TODAY},,{TODAY}", device.tool("store", "dump"))
        device.tool("forget", "--yes")
        self.assertFalse(aside.exists())


if __name__ == "__main__":
    unittest.main()
