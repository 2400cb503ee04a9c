"""Runs benchmarks, and keeps what they say in the table of figures and the page that is made from it."""
import datetime
import json
import os
import pathlib
import platform
import re
import subprocess
import sys
import tempfile

from performance import page, rows


def machine():
    cpu = re.search(r"model name\s*:\s*(.*)", pathlib.Path("/proc/cpuinfo").read_text())
    memory = int(pathlib.Path("/proc/meminfo").read_text().split()[1]) / (1 << 20)
    system = platform.freedesktop_os_release()["PRETTY_NAME"]
    compiler = subprocess.run(["g++", "--version"], capture_output=True, check=True).stdout.decode()
    return (f"{cpu[1] if cpu else platform.machine()}, {os.cpu_count()} cores, {memory:.0f} GiB; {system}, "
            f"Linux {platform.release()}, {compiler.splitlines()[0]}, `-O2`")


class Table:
    """The file of figures: the name of a benchmark to its date, machine, program, text and rows."""

    def __init__(self, path, benchmarks):
        self.path, self.benchmarks = path, benchmarks
        self.entries = json.loads(path.read_text()) if path.exists() else {}

    def page(self):
        return page.generate(self.benchmarks, self.entries)

    def save(self):
        names = [benchmark.name for benchmark in self.benchmarks]
        kept = {name: self.entries[name] for name in names if name in self.entries}
        self.path.write_text(json.dumps(kept, indent=1, ensure_ascii=False) + "\n")
        self.path.with_suffix(".md").write_text(self.page())

    def names(self, name):
        return {row["name"] for row in self.entries.get(name, {"rows": []})["rows"]}


def measure(benchmark, top):
    """Its entry of the table."""
    name = benchmark.name.split()
    program = f"scripts/{name[0]}" if (top / "scripts" / name[0]).exists() else f"build/bin/{name[0]}"
    with tempfile.NamedTemporaryFile("r", errors="replace", prefix="bench-figures-") as figures:
        try:
            result = subprocess.run([top / program, *name[1:]], capture_output=True, text=True, errors="replace",
                                    env={**os.environ, "BENCH_FIGURES": figures.name}, check=False)
        except OSError as reason:
            raise rows.Unreadable(str(reason)) from reason
        if result.returncode != 0:
            raise rows.Unreadable(f"exit status {result.returncode}: {(result.stderr or result.stdout)[-2000:]}")
        if not result.stdout.strip():
            raise rows.Unreadable("it prints nothing")
        found = rows.parse_all(figures.read())
    return {"date": str(datetime.date.today()), "machine": machine(), "program": program,
            "text": result.stdout.rstrip().split("\n"), "rows": found}


def run(benchmarks, names, top, table_path):
    """Measures those that are named, or all that need no name, and leaves the others' figures as they are. The
    exit status: 1 if a benchmark failed, or gave a ratio that misses its target by more than the tolerance, or
    gives one no longer."""
    table, faults = Table(table_path, benchmarks), []
    for benchmark in benchmarks:
        if benchmark.name not in names and (names or benchmark.when_named):
            continue
        print(f"== {benchmark.name}", flush=True)
        try:
            entry = measure(benchmark, top)
            if benchmark.draw:
                benchmark.draw(table_path.parent / "pictures" / benchmark.picture, entry["text"])
        except rows.Unreadable as reason:
            faults.append(f"{benchmark.name}: {reason}")
            continue
        print(*entry["text"], "", sep="\n", flush=True)
        before = table.names(benchmark.name)
        table.entries[benchmark.name] = entry
        table.save()  # so that nothing is lost with a run that is interrupted
        faults += [f"{benchmark.name}: no longer measured: {name}"
                   for name in sorted(before - table.names(benchmark.name))]
        faults += [f"{benchmark.name}: {rows.summary(row)}" for row in entry["rows"] if rows.is_missed(row)]
    for fault in faults:
        print(fault, file=sys.stderr)
    return 1 if faults else 0
