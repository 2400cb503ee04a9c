#!/usr/bin/env python3
"""The yardstick of bench_daily_log: the daily log's figures by a plain script.

daily_log.py DATABASE WHITELIST DAY OUTPUT: reads scalars(day, key, value) and
samples(day, key, offset, value), one row per sample in the order of their recording, and writes a
property list of the log's figures.
"""
import bisect
import hashlib
import math
import plistlib
import sqlite3
import sys


def rounded(value, options):
    step = options.get("bucket_interval")
    if step:
        value += step // 2
        value -= int(math.fmod(value, step))
    figures = options.get("sig_fig")
    if figures is not None and value != 0:
        shift = math.ceil(math.log10(abs(value))) - figures
        if shift >= 1:
            power = 10.0**shift
            quotient = value / power
            value = int(power * math.copysign(math.floor(abs(quotient) + 0.5), quotient))
    return value


class Summary:
    __slots__ = ("low", "high", "mean", "squares", "count", "boundaries", "counts")

    def __init__(self, boundaries):
        self.low = self.high = self.mean = self.squares = 0.0
        self.count = 0
        self.boundaries = boundaries
        self.counts = None if boundaries is None else [0] * (len(boundaries) + 1)

    def add(self, sample):
        self.count += 1
        if self.count == 1:
            self.low = self.high = self.mean = sample
        else:
            if sample < self.low:
                self.low = sample
            elif sample > self.high:
                self.high = sample
            delta = sample - self.mean
            self.mean += delta / self.count
            self.squares += delta * (sample - self.mean)
        if self.counts is not None:
            self.counts[bisect.bisect_left(self.boundaries, sample)] += 1

    def histogram(self):
        edges = ["-inf"] + [repr(bound).removesuffix(".0") for bound in self.boundaries] + ["inf"]
        last = len(self.boundaries)
        return {f"({edges[i]}, {edges[i + 1]}" + (")" if i == last else "]"): count
                for i, count in enumerate(self.counts) if count}


def main(database, whitelist, day, output):
    with open(whitelist, "rb") as file:
        content = file.read()
    scalar_options, distribution_options = {}, {}
    for group in plistlib.loads(content).values():
        scalar_options.update(group["ScalarKeys"])
        distribution_options.update(group["DistributionKeys"])
    connection = sqlite3.connect(database)
    scalars = {}
    for key, value in connection.execute("SELECT key, value FROM scalars WHERE day = ?", (day,)):
        options = scalar_options.get(key)
        if options is not None:
            scalars[key] = rounded(value, options)
    summaries = {key: Summary(options.get("intervals"))
                 for key, options in distribution_options.items()}
    for key, sample in connection.execute("SELECT key, value FROM samples WHERE day = ?", (day,)):
        summary = summaries.get(key)
        if summary is not None:
            summary.add(sample)
    found = {key: summary for key, summary in summaries.items() if summary.count}
    with open(output, "wb") as file:
        plistlib.dump({
            "TBScalars": scalars,
            "TBDistributions": {key: [s.low, s.high, s.mean, s.squares, s.count]
                                for key, s in found.items()},
            "TBDistributionsHistogram": {key: s.histogram() for key, s in found.items()
                                         if s.counts is not None},
            "TBWhitelistDigest": hashlib.md5(content).hexdigest()}, file)


main(sys.argv[1], sys.argv[2], int(sys.argv[3]), sys.argv[4])
