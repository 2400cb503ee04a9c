#!/usr/bin/env python3
"""export_rows.py FOLDER: the yardstick of bench_export, the rows of a spool's daily logs as NDJSON."""
import datetime
import json
import math
import pathlib
import plistlib
import sys

EPOCH = datetime.datetime(1970, 1, 1)


def bound(text):
    number = float(text)
    return None if math.isinf(number) else number


def rows(body, info):
    day = (body["TBStartDate"] - EPOCH).days
    head = {"schema": 1, "device": info.get("DevicePseudonym"), "sequence": info.get("SequenceNumber"), "day": day,
            "date": str(body["TBStartDate"].date()), "system_version": info.get("SystemVersion"),
            "configuration": info.get("Options", {}).get("ConfigNumber"), "log_version": body["TBCrashLogVersion"],
            "whitelist": body["TBWhitelistDigest"]}
    for key, value in body["TBScalars"].items():
        yield {**head, "key": key, "kind": "scalar", "value": str(value)}
    for key, (least, most, mean, deviations, count) in body["TBDistributions"].items():
        row = {**head, "key": key, "kind": "distribution", "count": count, "minimum": least, "maximum": most,
               "mean": mean, "squared_deviations": deviations}
        if buckets := body["TBDistributionsHistogram"].get(key):
            bounds = [label[1:-1].split(", ") for label in buckets]
            row.update(lower=[bound(lower) for lower, _ in bounds], upper=[bound(upper) for _, upper in bounds],
                       counts=list(buckets.values()))
        yield row


for path in sorted(pathlib.Path(sys.argv[1]).glob("*.log")):
    information = plistlib.loads(path.with_suffix(".info.plist").read_bytes())
    for line in rows(plistlib.loads(path.read_bytes()), information):
        sys.stdout.write(json.dumps(line, separators=(",", ":")) + "\n")
