"""docs/performance.md, from the table of figures alone (docs/performance.json)."""
import collections
import re

from performance import rows

HEAD = """# Performance

`scripts/bench` measures, keeps the figures in [performance.json](performance.json), and writes this page from there. Every figure has a yardstick from the same run: compare the ratios, not the times of different machines. A ratio is figure to yardstick, or yardstick to figure where a cost is to be so many times lower; a figure without a yardstick is compared with its target. Targets are the project's own. `scripts/bench` fails if one is missed by more than {tolerance:.0f} %.
"""
COLUMNS = "| figure | value | yardstick | ratio | target | |\n|---|--:|---|--:|---|---|"


def when(entry):
    return f"Measured on {entry['date']}: {entry['machine']}."


def anchor(title):
    return re.sub(r"[^a-z0-9 _-]", "", title.lower()).replace(" ", "-")


def table_row(title, row):
    yardstick = row["yardstick"]
    if yardstick not in {"", rows.ITSELF}:
        yardstick = f"{rows.shown(row['yardstick_value'])} {row['unit']}, {yardstick}"
    return (f"| [{row['name']}](#{anchor(title)}) | {rows.shown(row['value'])} {row['unit']} | {yardstick} | "
            f"{rows.shown_ratio(row)} | {rows.shown_target(row)} | {rows.verdict(row)} |")


def section(benchmark, entry, usual):
    lines = [f"## {benchmark.title}", "", f"{benchmark.what} (`{entry['program']}`)", ""]
    if when(entry) != usual:
        lines += [when(entry), ""]
    lines += ["```text", *entry["text"], "```", ""]
    if benchmark.picture:
        lines += [f"![{benchmark.title}](pictures/{benchmark.picture})", ""]
    return lines


def generate(benchmarks, entries):
    """entries: name of a benchmark to what was measured. Those that were not measured are left out."""
    measured = [(benchmark, entries[benchmark.name]) for benchmark in benchmarks if benchmark.name in entries]
    usual = collections.Counter(when(entry) for _, entry in measured).most_common(1)
    usual = usual[0][0] if usual else ""
    listed = [(benchmark.title, row) for benchmark, entry in measured for row in entry["rows"]]
    judged = [row for _, row in listed if row["sense"]]
    met = sum(rows.missed_by(row) == 0 for row in judged)
    lines = [HEAD.format(tolerance=rows.TOLERANCE * 100), usual, "", "## Figures and targets", "",
             f"{met} of {len(judged)} targets are met.", "", COLUMNS, *(table_row(*each) for each in listed), ""]
    for benchmark, entry in measured:
        lines += section(benchmark, entry, usual)
    return "\n".join(lines).rstrip() + "\n"
