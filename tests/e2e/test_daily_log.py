"""The daily log of the real program, read back and recomputed independently."""
import datetime
import math
import plistlib
import random
import unittest
from fractions import Fraction

import hashlib

from device import (DeviceTest, TODAY, WHITELIST, group, texts)

YESTERDAY = TODAY - 1


def rounded(value, options):
    """The rounding rules in exact integers."""
    step = options.get("bucket_interval", 0)
    if step:
        value += step // 2
        value -= int(math.fmod(value, step)) if abs(value) < 2**53 else 0
    figures = options.get("sig_fig")
    if figures is not None and value:
        shift = math.ceil(math.log10(abs(value))) - figures
        if shift >= 1:
            quotient = Fraction(abs(value), 10**shift)
            whole = math.floor(quotient + Fraction(1, 2))
            value = int(math.copysign(1, value)) * whole * 10**shift
    return value


def summary(samples):
    low = high = mean = squares = 0.0
    for count, sample in enumerate(samples, 1):
        if count == 1:
            low = high = mean = sample
            continue
        low, high = min(low, sample), max(high, sample)
        delta = sample - mean
        mean += delta / count
        squares += delta * (sample - mean)
    return [low, high, mean, squares, len(samples)]


def text(number):
    return str(int(number)) if float(number).is_integer() else repr(number)


def histogram(samples, bounds):
    counts = {}
    edges = ["-inf"] + [text(bound) for bound in bounds] + ["inf"]
    for sample in samples:
        bucket = next((i for i, bound in enumerate(bounds) if bound >= sample), len(bounds))
        label = f"({edges[bucket]}, {edges[bucket + 1]}" + (")" if bucket == len(bounds) else "]")
        counts[label] = counts.get(label, 0) + 1
    return counts


class DailyLog(DeviceTest):
    def test_figures_are_those_of_an_independent_computation(self):
        source = random.Random(1)
        options = [{}, {"sig_fig": 1}, {"sig_fig": 3}, {"bucket_interval": 7},
                   {"bucket_interval": 100, "sig_fig": 2}, {"sig_fig": 0}]
        scalars = {f"s.{i:03}": (source.choice([1, -1]) * source.randrange(10**(1 + i % 12)),
                                 options[i % len(options)]) for i in range(120)}
        bounds = [[], [10], [-5, 0, 2.5, 10, 1e3], [3, 1, 2]]
        distributions = {f"d.{i}": ([round(source.gauss(5, 20), 3) for _ in range(i * i * 60)],
                                    bounds[i % len(bounds)] if i % 5 else None) for i in range(12)}
        distributions["d.edge"] = ([-5.0, 0.0, 2.5, 2.5000001, 1e3, -1e300, 1e300], bounds[2])
        distributions["d.large"] = ([1e15 + i / 8 for i in range(9000)], None)
        device = self.device
        device.whitelist(G=group({key: opts for key, (_, opts) in scalars.items()},
                                 {key: {} if b is None else {"intervals": b}
                                  for key, (_, b) in distributions.items()}))
        device.store([(key, YESTERDAY, value) for key, (value, _) in scalars.items()] +
                     [("secret", YESTERDAY, 1), ("s.001", TODAY, 5), ("s.002", YESTERDAY - 1, 6)],
                     [(key, YESTERDAY, samples) for key, (samples, _) in distributions.items()] +
                     [("secret", YESTERDAY, [1.0]), ("d.1", TODAY, [99.0])])
        messages = device.run("-f")
        log = device.log()
        self.assertEqual(log["TBScalars"],
                         {key: rounded(value, opts) for key, (value, opts) in scalars.items()})
        recorded = {key: entry for key, entry in distributions.items() if entry[0]}
        self.assertEqual(log["TBDistributions"],
                         {key: summary(samples) for key, (samples, _) in recorded.items()})
        self.assertEqual(log["TBDistributionsHistogram"],
                         {key: histogram(samples, b) for key, (samples, b) in recorded.items()
                          if b is not None})
        for figures in log["TBDistributions"].values():
            self.assertEqual([type(figure) for figure in figures], [float] * 4 + [int])
        self.assertEqual(texts(messages, "error"), [])

    def test_document_keys_types_and_submission(self):
        device = self.device
        device.whitelist(G=group({"a": {}, "vellum.dockyard.numAllInstalledApps": {}}))
        device.store([("a", day, day) for day in (YESTERDAY, TODAY)])
        device.describe(OSVersion="5.1", Applications=["User", "System"], RegionCode="CH",
                        PreferredLanguages=["de-CH"], SystemLanguages=["en", "de"])
        messages = device.run("-f")
        path, = device.log_files()
        body = path.read_bytes()
        self.assertTrue(body.startswith(b'<?xml version="1.0" encoding="UTF-8"?>\n<!DOCTYPE plist'))
        self.assertEqual(path.stat().st_mode & 0o777, 0o600)
        noon = datetime.datetime(2026, 3, 2, 12, 0)
        log = device.log()
        creation = log.pop("TBLogCreationDate")
        self.assertLess(abs(creation - noon), datetime.timedelta(minutes=5))
        digest = hashlib.md5((device.root / WHITELIST).read_bytes()).hexdigest()
        self.assertEqual(log, {
            "TBCrashLogVersion": 1,
            "TBStartDate": datetime.datetime(2026, 3, 1),
            "TBMetadata": {"TBUserInterfaceLanguage": "de",
                           "TBPreferredUserInterfaceLanguage": "de-CH",
                           "TBUserSetRegionFormat": "CH"},
            "TBScalars": {"a": YESTERDAY, "vellum.dockyard.numAllInstalledApps": 2},
            "TBDistributions": {}, "TBDistributionsHistogram": {}, "TBTasking": [],
            "TBTaskID": "(no tasking id)", "TBTaskDigest": "(no tasking digest)",
            "TBWhitelistDigest": digest})
        info = device.info(path)
        self.assertEqual((info["TypeCode"], info["Name"]), ("193", "log-tallyd"))
        self.assertEqual(info["Options"], {"previous_os_version": "<unknown>"})
        self.assertEqual(device.preferences()["LastOSVersion"], "5.1")
        self.assertEqual(texts(messages, "default"),
                         ["tallyrun started", f"daily tasks for day {YESTERDAY}", "tallyrun ended"])
        self.assertEqual(texts(messages, "info"), [f"writing tallyd log. yesterday={YESTERDAY}"])

        device.run("-f", day=TODAY + 1)
        self.assertNotIn("Options", device.info(device.log_files()[1]))
        device.describe(OSVersion="5.2")
        device.run("-f", day=TODAY + 1)
        self.assertEqual(device.info(device.log_files()[2])["Options"],
                         {"previous_os_version": "5.1"})

    def test_tasking_in_force_is_carried(self):
        device = self.simple()
        payload = [{"Domain": "vellum.da", "User": "mobile", "Key": "G", "Value": True}]
        device.set_preferences(TaskingID="T-1", TaskingDigest=b"\x01\x02", TaskingPayload=payload)
        device.run("-f")
        log = device.log()
        self.assertEqual((log["TBTaskID"], log["TBTaskDigest"], log["TBTasking"]),
                         ("T-1", "<0102>", payload))

    def test_keys_that_xml_cannot_carry_cost_only_themselves(self):
        device = self.device
        device.whitelist(G=group(scalar_prefixes={"plain": {}, "bell": {}, "caf": {}}))
        device.store([("plain <&>", YESTERDAY, 1), ("bell\x07", YESTERDAY, 2),
                      ("caf\u00e9 \U0001f600", YESTERDAY, 3)])
        device.run("-f")
        self.assertEqual(device.log()["TBScalars"],
                         {"plain <&>": 1, "bell\ufffd": 2, "caf\u00e9 \U0001f600": 3})

    def test_a_whitelist_in_any_encoding(self):
        for encoding in (plistlib.FMT_XML, plistlib.FMT_BINARY):
            device = self.simple()
            device.write(WHITELIST, plistlib.dumps({"G": group({"a": {}})}, fmt=encoding))
            device.run("-f")
            self.assertEqual(self.logged_days(device), [YESTERDAY])

    def test_the_programs_tool_shows_the_same_log(self):
        device = self.simple()
        preview = plistlib.loads(device.tool("report", "preview", "--day", str(YESTERDAY),
                                             "--xml").encode())
        device.run("-f")
        log = device.log()
        for document in (preview, log):
            del document["TBLogCreationDate"]
        self.assertEqual(preview, log)


if __name__ == "__main__":
    unittest.main()
