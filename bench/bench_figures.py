"""Rows of a benchmark in the table of docs/performance.md; bench/figures.h says what they mean.

    add_figure("opening the page", seconds, "s", at_most(2))
    add_figure("CPU beside collectd", ours, "ns", at_most(0.5), beside=("collectd", theirs))
"""
import os


def at_most(value):
    return "at most", value


def at_least(value):
    return "at least", value


def times_less(value):
    return "times less", value


NO_TARGET = ("none", 0)


def add_figure(name, value, unit, target=NO_TARGET, beside=("", "")):
    """beside: a yardstick's name and value."""
    if path := os.environ.get("BENCH_FIGURES"):
        with open(path, "a", encoding="utf-8") as file:
            print(name, value, unit, *beside, *target, sep="\t", file=file)
