"""Tasking by the real program on real preference files."""
import plistlib
import unittest

from device import DeviceTest, TODAY, texts

SCHEDULE = "Library/Preferences/vellum.Ferryman.plist"
FILES = {"mobile": "var/mobile/Library/Preferences/dom.plist", "__sysmetra__": "Library/Preferences/dom.plist",
         "guest": "var/guest/Library/Preferences/dom.plist"}
RECORD = ("TaskingID", "TaskingOS", "TaskingDigest", "TaskingPayload", "TaskingUnfinished")

def payload(identifier):
    return [{"User": user, "Domain": "dom", "Key": f"{identifier}0", "Value": 0} for user in FILES]

class Tasking(DeviceTest):
    def schedule(self, device, identifier, entries):
        schedule = {"TaskingID": identifier, "TaskingDigest": b"\1\2", "TaskingPayload": entries}
        device.write(SCHEDULE, plistlib.dumps({"ScheduledTasking": schedule}, fmt=plistlib.FMT_BINARY))

    def values(self, device):
        found = {}
        for user, path in FILES.items():
            file = device.root / path
            found[user] = plistlib.loads(file.read_bytes()) if file.exists() else {}
        return found

    def test_scheduled_changed_and_repaired(self):
        device = self.simple()
        device.describe(SystemVersion={"ProductBuildVersion": "16S46"})
        self.schedule(device, "A", payload("A"))
        first = texts(device.run("-d"))
        self.assertIn("OS change since last run ((null) -> 16S46)", first)
        self.assertEqual(self.values(device), {user: {"A0": 0} for user in FILES})
        record = device.preferences()
        self.assertEqual([record.get(key) for key in RECORD], ["A", "16S46", b"\1\2", payload("A"), None])
        self.assertEqual(record["LastOSUpdate"], {"version": "16S46", "day": TODAY})
        # The log of the day before carries what was in force when it was written.
        self.assertEqual(device.log()["TBTaskID"], "(no tasking id)")

        # A system update applies it again; the next run is quiet, and its log names the tasking.
        device.describe(SystemVersion={"ProductBuildVersion": "16S50"})
        self.assertIn("Tasking update (A -> A, 16S46 -> 16S50)", texts(device.run("-f")))
        self.assertNotIn("Tasking update", " ".join(texts(device.run("-f"))))
        self.assertEqual(device.logs()[-1]["TBTaskID"], "A")

        self.schedule(device, "B", payload("B"))
        device.run("-f")
        self.assertEqual(self.values(device), {user: {"B0": 0} for user in FILES})
        self.assertEqual(device.preferences()["TaskingID"], "B")
        self.assertNotIn("TaskingUnfinished", device.preferences())

if __name__ == "__main__":
    unittest.main()
