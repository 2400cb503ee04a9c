#!/usr/bin/env python3
"""Makes the device of the fault walks, without its store.

make-device.py MAKE-STORAGE MAKE-STORAGE-LISTS ROOT DAY, the first two being the scripts that make the
storage driver of the sample device. It has all that a day writes to: logs, structured data, events, and preferences of three users.
"""
import pathlib
import plistlib
import subprocess
import sys

PROGRAM_PREFERENCES = {"SpoolMaximumLogs": 3}  # so that each log makes an older one go


def tasking(name):
    return {"TaskingID": name, "TaskingDigest": name.encode(), "TaskingPayload": [
        {"User": user, "Domain": "dom", "Key": name, "Value": 1}
        for user in ("mobile", "__sysmetra__", "guest")]}


def main():
    make_storage, make_lists, root, day = sys.argv[1:]
    root = pathlib.Path(root)
    lists = {
        "Library/Application Support/Tallybook/Whitelist_Nimbus.plist": {"Group": {
            "ScalarKeys": {"count": {}}, "DistributionKeys": {"time": {"intervals": [1, 10]}},
            "ScalarKeyPrefixes": {}, "DistributionKeyPrefixes": {}}},
        "device/device.plist": {
            "SystemVersion": {"ProductBuildVersion": "16S46"}, "OSVersion": "5.1",
            "Applications": ["User"], "PreferredLanguages": [], "SystemLanguages": [],
            "AnalyticsEvents": {"Wanted": ["vellum.massstorage.NANDInfo.BootTimes"]}},
        "var/mobile/Library/Preferences/vellum.tallyd.tallyrun.plist": PROGRAM_PREFERENCES,
        # To be put in force one after the other.
        "schedules/former.plist": {"ScheduledTasking": tasking("former")},
        "schedules/present.plist": {"ScheduledTasking": tasking("present")},
        "schedules/next.plist": {"ScheduledTasking": tasking("next")},
    }
    for path, content in lists.items():
        (root / path).parent.mkdir(parents=True, exist_ok=True)
        (root / path).write_bytes(plistlib.dumps(content))
    subprocess.run([sys.executable, make_storage, root, day], check=True)
    subprocess.run([sys.executable, make_lists, root, "spx", "0"], check=True)
    # Fewer records of one kind: a walk is as long as the day.
    registry = root / "device/registry.plist"
    content = plistlib.loads(registry.read_bytes())
    for client in (entry["UserClient"] for entry in content["Entries"] if "UserClient" in entry):
        client["Methods"] = [answer for answer in client["Methods"] if answer.get("Data") not in
                             ("storage-telemetry-1.bin", "storage-telemetry-2.bin")]
    registry.write_bytes(plistlib.dumps(content))


if __name__ == "__main__":
    main()
