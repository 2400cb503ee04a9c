"""The scheduled mode on a real bus, with the clients that everybody has. Every conversation ends with
ten quiet seconds, so many of them are held at once, each on a device and a bus of its own."""
import concurrent.futures
import json
import os
import time
import unittest

from bus import BusDevice, NAME, TODAY
from device import BIN, LAST_DAY

YESTERDAY = TODAY - 1
NOTIFIED = "notified of logging status, waiting for activate app info"
NEVER = "never received requested AAI, so moving along without it"
LOGGING = (f"{NAME}", "logging")
SUBMITTED = (f"{NAME}", "submitted")
ELEMENTS = ["aa{sv}", "1", "5", "bundle_id", "s", "org.example.mail", "version", "s", "7.1", "adam_id", "x",
            "5000000000", "arch", "x", "-2", "uuid", "ay", "16", *map(str, range(0, 256, 17))]
MAIL = {"bundle": "org.example.mail", "version": "7.1", "adamID": 5000000000, "arch": -2,
        "uuid": "00112233-4455-6677-8899-AABBCCDDEEFF"}
GVARIANT = ("{'operation': <int64 2>, 'app_data': <[{'bundle_id': <'org.example.mail'>, 'version': <'7.1'>, "
            "'adam_id': <int64 5000000000>, 'arch': <int64 -2>, 'uuid': <[%s]>}]>}"
            % ", ".join(f"byte {value}" for value in range(0, 256, 17)))

def expected_conversation(test, device):
    """Two messages by stock tools, and the list is in the day's log."""
    monitor = device.monitor()
    device.busctl("operation", "x", "0")
    device.gdbus(GVARIANT)
    device.gdbus(GVARIANT)  # nobody asked for a second one
    found = device.wait_for_end()
    heads = [text.partition("\n")[0].partition("\\n")[0] for text in found]
    del heads[4:-3]  # what the sweep says, which other tests check
    test.assertEqual(heads, ["tallyrun started", NOTIFIED, "tallyrun got requestedAAI:",
                             f"daily tasks for day {YESTERDAY}", "OS change since last run ((null) -> 16S46)",
                             "tallyrun got (unsolicited -- so ignoring) AAI:", "tallyrun ended"])
    test.assertEqual(device.log()["TBActivatedAppInfo"], [MAIL])
    test.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)
    # The next message starts a new process, which takes part in the same conversation.
    device.busctl("operation", "x", "0")
    device.busctl("operation", "x", "2", "app_data", *ELEMENTS, count=2)
    found = device.wait_for_end(runs=2)
    test.assertEqual(found.count("Day unchanged since last run"), 1)
    monitor.terminate()
    monitor.wait()
    test.assertEqual([signal[-2:] for signal in device.signals()], [LOGGING, SUBMITTED, LOGGING])

def list_that_never_comes(test, device):
    began = time.monotonic()
    device.tool("send", "logging")
    device.tool("send", "logging")
    device.busctl("operation", "x", "1", "value", "x", "20000", count=2)  # too late for this run
    found = device.wait_for_end()
    test.assertGreater(time.monotonic() - began, 9.5)
    test.assertEqual((found.count(NOTIFIED), found.count(NEVER)), (1, 1))
    test.assertNotIn("TBActivatedAppInfo", device.log())
    test.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)

def day_request(test, device):
    device.set_preferences(**{LAST_DAY: 5})
    device.tool("send", "day", str(TODAY - 3))
    test.assertIn("serves the device root",
                  device.client(BIN / "tallyctl", "send", "--root", "/", "day", "1", status=1))
    device.tool("send", "logging")
    found = device.wait_for_end()
    test.assertEqual(device.log()["TBScalars"]["a"], TODAY - 3)
    test.assertEqual(device.preferences()[LAST_DAY], 5)
    test.assertNotIn(NOTIFIED, found)

def hostile_messages(test, device):
    bad_uuid = ELEMENTS[:-17] + ["3", "1", "2", "3"]
    two = ["aa{sv}", "2"] + ELEMENTS[2:] + bad_uuid[2:]
    nested = ["v"] * 20 + ["s", "deep"]
    cases = [  # fields, exit status of the client, what the line says if it is the first of its kind
        (1, ["operation", "s", "0"], 0, 'no 64-bit integer "operation"'),
        (0, [], 0),
        (1, ["operation", "x", "1"], 0, 'no 64-bit integer "value"'),
        (1, ["operation", "x", "2"], 0, 'no array "app_data"'),
        (2, ["operation", "x", "2", "app_data", *two], 0, "1 of 2 elements skipped; element 1: "),
        (2, ["operation", "x", "2", "app_data", "av", "2", "s", "x", "(xx)", "1", "2"], 0),
        (2, ["operation", "x", "0", "x", *nested], 1, "nested too deeply"),
        (2, ["operation", "x", "0", "x", "as", "20001", *["y"] * 20_001], 1),
    ]
    # Not a dictionary, and one of the wrong type: accepted, and ignored without a log line.
    device.dbus_send("string:hello")
    device.dbus_send("dict:string:int64:operation,0")
    lines = []
    with device.kept_awake():
        for count, fields, status, *line in cases:
            device.busctl(*fields, count=count, status=status)
            lines += line
        large = {"bundle_id": "a", "version": "x" * (17 << 20), "adam_id": 1, "arch": 1, "uuid": MAIL["uuid"]}
        device.tool("send", "apps", "-", stdin=json.dumps([large]).encode(), status=1)
        if os.getuid() == 0:
            test.assertIn("Access denied", device.busctl("operation", "x", "0", user="nobody", status=1))
            lines.append("is not accepted")
        # After all that the program still serves well-formed messages.
        device.busctl("operation", "x", str(7 << 32 | 1), "value", "x", str(3 << 32 | TODAY - 2), count=2)
        device.until(device.log_files, 150, "the log of the day that was asked for")
    device.wait_for_end()
    lines += ["elements skipped: 1 more", "above the limits: 2 more", '"operation": 1 more']
    errors = device.error_texts()
    test.assertEqual(len(errors), len(lines), errors)
    for error, line in zip(errors, lines):
        test.assertIn(line, error)
    test.assertEqual(device.log()["TBScalars"]["a"], TODAY - 2)

def sender_that_is_gone(test, device):
    """The bus's policy decides whether its message counts; a lost one is logged."""
    device.busctl("operation", "x", "0", waits=False)  # it is gone before there is a program to take this
    device.wait_for_end()
    test.assertIn("the message that started this run is lost", device.error_texts()[0])
    device.dbus_send("string:hello")
    with device.suspended():
        device.busctl("operation", "x", "1", "value", "x", str(TODAY - 3), count=2, waits=False)
    device.wait_for_end(runs=2)
    if device.shipped_policy:
        test.assertEqual(device.log()["TBScalars"]["a"], TODAY - 3)
        device.busctl("operation", "x", "0", user="nobody", status=1)  # by the bus
        test.assertEqual(len(device.error_texts()), 1)
    else:
        test.assertEqual(device.log_files(), [])
        test.assertIn("its sender did not wait", device.error_texts()[1])

def refused_messages(test, device):
    """They do not keep the program running, however many arrive."""
    device.dbus_send("string:hello")
    while "tallyrun ended" not in device.default_texts():
        device.busctl("operation", "x", "0", user="nobody", status=1)
    test.assertEqual(device.default_texts()[:2], ["tallyrun started", "tallyrun ended"])

def bus_that_dies(test, device):
    device.tool("send", "logging")
    device.until(lambda: NOTIFIED in device.default_texts(), 30, "the announcement")
    device.kill_daemon()
    test.assertIn(NEVER, device.wait_for_end())
    test.assertEqual(device.preferences()[LAST_DAY], YESTERDAY)

def no_bus(test, device):
    device.kill_daemon()
    started, fault, *_, ended = [text for _, text in device.run(day=None)]
    test.assertEqual((started, ended), ("tallyrun started", "tallyrun ended"))
    test.assertIn("cannot listen", fault)
    test.assertIn("not sent", device.client(BIN / "tallyctl", "send", "logging", status=1))

CONVERSATIONS = [(conversation, False) for conversation in (
    expected_conversation, list_that_never_comes, day_request, sender_that_is_gone, bus_that_dies, no_bus)]
if os.getuid() == 0:
    CONVERSATIONS += [(refused_messages, False), (expected_conversation, True), (sender_that_is_gone, True)]

class Endpoint(unittest.TestCase):
    def hold(self, conversation, shipped_policy=False):
        device = BusDevice(shipped_policy=shipped_policy)
        try:
            device.fill()
            device.describe(SystemVersion={"ProductBuildVersion": "16S46"})
            conversation(self, device)
        finally:
            device.remove()

    # Apart from the others, whose ten seconds it would use up on a slow machine.
    def test_hostile_messages(self):
        self.hold(hostile_messages)

    def test_conversations(self):
        with concurrent.futures.ThreadPoolExecutor(len(CONVERSATIONS)) as pool:
            held = [pool.submit(self.hold, *pair) for pair in CONVERSATIONS]
            for (conversation, _), result in zip(CONVERSATIONS, held):
                with self.subTest(conversation.__name__):
                    result.result()

if __name__ == "__main__":
    unittest.main()
