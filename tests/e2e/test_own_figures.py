"""What a log says about its own clock, losses and cost, when the whitelist asks for it; else nothing is kept."""
import plistlib
import socket
import sqlite3
import unittest

from device import STORE, DeviceTest, group
from installed import TOP
from recorder import RecordingDevice

OWN = plistlib.loads((TOP / "examples/own-figures/Whitelist_Nimbus.plist").read_bytes())


class OwnFigures(DeviceTest):
    def send(self, device, lines):
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as client:
            client.sendto(lines, device.socket("statsd.sock"))

    def query(self, device, text):
        with sqlite3.connect(device.root / STORE) as store:
            return store.execute(text).fetchall()

    def own(self, log):
        return {key: value for key, value in log["TBScalars"].items() if key in OWN["OwnFigures"]["ScalarKeys"]}

    def test_two_days_with_figures_of_their_own(self):
        device = RecordingDevice()
        self.addCleanup(device.remove)
        today = device.today - 1  # of the recorder, whose clock is the machine's
        device.whitelist(G=group({"a": {}}), **OWN)
        device.run("-f", day=today)
        self.send(device, b"a:1|c\nnothing")
        device.commit()
        device.tool("channels", "keep", day=today)
        self.query(device, f"INSERT INTO scalars VALUES ({today}, 'damaged', 'a text')")
        device.run("-f", day=today + 1)
        figures = self.own(device.log())
        costs = [figures.pop(f"vellum.tallyrun.cost.{name}") for name in ("cpu", "peak_memory", "written")]
        self.assertGreater(costs[1], 1000)
        self.assertLess(costs[1], 200_000)
        self.assertLess(figures.pop("vellum.tallyd.time.running"), 300)
        self.assertEqual(figures, {"vellum.tallyd.refused.total": 1, "vellum.tallyrun.loss.damaged_rows": 1})
        # The runs are days apart for a boot that is not, as if the clock had been set twice.
        device.store([("a", today + 1, 2)])
        device.run("-f", day=today + 2)
        figures = self.own(device.logs()[1])
        self.assertIn(figures.pop("vellum.tallyrun.time.synchronised", 0), (0, 1))
        self.assertGreater(figures.pop("vellum.tallyrun.time.steps"), 0)
        self.assertEqual({key: value for key, value in figures.items() if ".cost." not in key},
                         {"vellum.tallyrun.time.boots": 0, "vellum.tallyrun.time.suspended": 0,
                          "vellum.tallyrun.loss.damaged_rows": 0})

    def test_without_them_in_the_whitelist_nothing_is_kept(self):
        device = RecordingDevice()
        self.addCleanup(device.remove)
        device.whitelist(G=group({"a": {}}))
        for day in (device.today - 1, device.today):
            device.run("-f", day=day)
            self.send(device, b"a:1|c\nnothing")
            device.commit()
            device.tool("channels", "keep", day=day)
        self.assertEqual(self.own(device.log()), {})
        tables = self.query(device, "SELECT name FROM sqlite_schema WHERE name IN ('scalars', 'counters')")
        keys = {key for table, in tables for key, in self.query(device, f"SELECT key FROM {table}")}
        self.assertEqual(keys & set(OWN["OwnFigures"]["ScalarKeys"]), set())
        self.assertIn("vellum.tallyd.refused.malformed", keys)


if __name__ == "__main__":
    unittest.main()
