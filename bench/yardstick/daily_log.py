#!/usr/bin/env python3
"""The yardstick of bench_daily_log: the daily log's figures by a plain script.

daily_log.py DATABASE WHITELIST DAY OUTPUT: reads scalars(day, key, value) and
samples(day, key, offset, value), one row per sample, and writes a property list of the log's
TBScalars, TBDistributions, TBDistributionsHistogram and TBWhitelistDigest.
"""
import hashlib
import math
import plistlib
import sqlite3
import sys
from itertools import groupby
from operator import itemgetter


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


def bucket(sample, boundaries):
    for position, boundary in enumerate(boundaries):
        if boundary >= sample:
            return position
    return len(boundaries)


def summarise(samples, boundaries):
    counts = None if boundaries is None else [0] * (len(boundaries) + 1)
    low = high = mean = squares = 0.0
    count = 0
    for _, sample in samples:
        count += 1
        if count == 1:
            low = high = mean = sample
        else:
            if sample < low:
                low = sample
            elif sample > high:
                high = sample
            delta = sample - mean
            mean += delta / count
            squares += delta * (sample - mean)
        if counts is not None:
            counts[bucket(sample, boundaries)] += 1
    return [low, high, mean, squares, count], counts


def text(number):
    return repr(number) if isinstance(number, int) else f"{number:.17g}" if number != float(
        repr(number)) else repr(number).removesuffix(".0")


def labelled(counts, boundaries):
    edges = ["-inf"] + [text(boundary) for boundary in boundaries] + ["inf"]
    last = len(boundaries)
    return {f"({edges[i]}, {edges[i + 1]}" + (")" if i == last else "]"): count
            for i, count in enumerate(counts) if count}


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
    distributions, histograms = {}, {}
    rows = connection.execute("SELECT key, value FROM samples WHERE day = ?", (day,))
    for key, samples in groupby(rows, itemgetter(0)):
        options = distribution_options.get(key)
        if options is None:
            continue
        boundaries = options.get("intervals")
        distributions[key], counts = summarise(samples, boundaries)
        if counts is not None:
            histograms[key] = labelled(counts, boundaries)
    with open(output, "wb") as file:
        plistlib.dump({"TBScalars": scalars, "TBDistributions": distributions,
                       "TBDistributionsHistogram": histograms,
                       "TBWhitelistDigest": hashlib.md5(content).hexdigest()}, file)


main(sys.argv[1], sys.argv[2], int(sys.argv[3]), sys.argv[4])
