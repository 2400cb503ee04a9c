"""The plots of docs/performance.md, from what the benchmarks print."""
import re
import subprocess

from performance.rows import Unreadable

PLOT = """
set terminal svg size 900,420 background '#ffffff' font 'sans,13'
set output '{output}'
set logscale xy
set grid
set key outside right top
set xlabel '{x}'
set ylabel '{y}'
set title '{title}'
plot {curves}
"""


def plot(output, title, x, y, curves):
    """curves: label to a list of (x, y)."""
    if not any(curves.values()):
        raise Unreadable(f"nothing to draw {output.name} from")
    data = "".join(f"$d{i} << END\n" + "".join(f"{a} {b}\n" for a, b in points) + "END\n"
                   for i, points in enumerate(curves.values()))
    drawn = ", ".join(f"$d{i} with linespoints lw 2 pt 7 ps 0.6 title '{label}'"
                      for i, label in enumerate(curves))
    script = data + PLOT.format(output=output, title=title, x=x, y=y, curves=drawn)
    subprocess.run(["gnuplot"], input=script.encode(), check=True)


def daily_log(output, lines):
    rows = [line.split() for line in lines[1:]]
    plot(output, "The daily log: CPU time against the samples of the day",
         "samples (and 100,000 scalars)", "seconds of CPU time",
         {"tallyrun -f, whole": [(row[0], row[1]) for row in rows],
          "one SQL query, a row for each sample": [(row[0], row[2]) for row in rows]})


def channels(output, lines):
    found = {}
    for line in lines:
        match = re.match(r"(\D+?) +([\d.]+) +([\d.]+) +([\d.]+) +[\d.]+ +[\d.]+ +[\d.]+$", line)
        if match:
            found[match[1]] = list(zip((1_000, 10_000, 100_000), match.groups()[1:]))
    plot(output, "Statistics channels: cost of each against their number",
         "channels", "nanoseconds for each channel", found)
