"""Tasking by the real program on real preference files."""
import plistlib
import random
import time
import unittest

from device import DeviceTest, LAST_DAY, TODAY, texts

SCHEDULE = "Library/Preferences/vellum.Ferryman.plist"
FILES = {"mobile": "var/mobile/Library/Preferences/dom.plist", "__sysmetra__": "Library/Preferences/dom.plist",
         "guest": "var/guest/Library/Preferences/dom.plist"}
RECORD = ("TaskingID", "TaskingOS", "TaskingDigest", "TaskingPayload", "TaskingUnfinished")


def payload(identifier, count=1):
    return [{"User": user, "Domain": "dom", "Key": f"{identifier}{i}", "Value": i}
            for i in range(count) for user in FILES]


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

    def faults(self, device):
        return [text for text in texts(device.run("-f"), "error") if text.startswith("tasking: ")]

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

        # Killed again and again on its way to one tasking, and then another is scheduled.
        for attempt in range(12):
            self.schedule(device, f"K{attempt}", payload(f"K{attempt}-", 6))
            process = device.start("-f")
            time.sleep(0.02 + random.random() * 0.25)
            process.kill()
            process.communicate()
        self.schedule(device, "B", payload("B"))
        device.run("-f")
        self.assertEqual(self.values(device), {user: {"B0": 0} for user in FILES})
        self.assertEqual(device.preferences()["TaskingID"], "B")
        self.assertNotIn("TaskingUnfinished", device.preferences())

    def test_what_could_not_be_written_is_tried_again(self):
        device = self.simple()
        device.describe(SystemVersion={"ProductBuildVersion": "16S46"})
        device.write("var/guest", b"a file in the folder's place")
        # The record cannot hold this identifier as it is, and still tells that it is in force.
        self.schedule(device, "A\x01", payload("A"))
        for _ in range(2):
            self.assertEqual(len(self.faults(device)), 1)
            self.assertNotIn("TaskingID", device.preferences())
            self.assertIn("TaskingUnfinished", device.preferences())
        written = (device.root / FILES["mobile"]).stat().st_ino
        (device.root / "var/guest").unlink()
        self.assertEqual(self.faults(device), [])
        self.assertEqual(self.values(device), {user: {"A0": 0} for user in FILES})
        self.assertEqual((device.root / FILES["mobile"]).stat().st_ino, written)
        record = device.preferences()
        self.assertEqual([record.get(key) for key in RECORD],
                         ["A\ufffd", "16S46", b"\1\2", payload("A"), None])
        self.assertNotIn("asking", " ".join(texts(device.run("-f"))))

    def test_nothing_outside_the_folders_is_written(self):
        device = self.simple()
        names = ["../../../escaped", "..", ".", "", "a/b", "/etc/escaped"]
        entries = [dict(payload("A")[0], **{field: name}) for field in ("Domain", "User") for name in names]
        # A key is text inside of a file; a group of the whitelist may be named like that.
        keys = [dict(payload("A")[0], Key=name) for name in names + ["Wi-Fi / Cellular"]]
        self.schedule(device, "A", entries + keys + payload("A"))
        before = {path for path in device.root.rglob("*")}
        messages = device.run("-f")
        self.assertEqual(sum("is skipped" in text for text in texts(messages, "error")), len(entries))
        written = {user: {"A0": 0} for user in FILES}
        written["mobile"].update({entry["Key"]: 0 for entry in keys})
        self.assertEqual(self.values(device), written)
        made = {str(path.relative_to(device.root)) for path in device.root.rglob("*")} - \
            {str(path.relative_to(device.root)) for path in before}
        self.assertEqual([path for path in made if "escaped" in path], [])
        self.assertEqual({path.name for path in device.root.glob("var/*")}, {"mobile", "guest"})
        self.assertNotIn(LAST_DAY, device.preferences())


if __name__ == "__main__":
    unittest.main()
