"""The table of figures and the page that is made from it; what scripts/bench says of benchmarks, with programs
that stand in for them."""
import contextlib
import io
import json
import pathlib
import sys
import tempfile
import unittest
import unittest.mock

TOP = pathlib.Path(__file__).resolve().parents[2]
sys.path.insert(0, str(TOP / "bench"))
from bench_figures import add_figure, at_least, at_most, times_less  # noqa: E402
from performance import measure, page, rows  # noqa: E402
from performance.benchmarks import BENCHMARKS, Benchmark  # noqa: E402

TABLE = TOP / "docs/performance.json"
ROW = "peak\\t{}\\tMiB\\t\\t\\tat most\\t100\\n"
SAYS = "echo text; printf '{}' >>$BENCH_FIGURES"
# Whose figure is to be at most 100: what the program does, the exit status of the run, what is said of it.
FAKES = {
    "met": (SAYS.format(ROW.format(100)), 0, ""),
    "missed by 5 %": (SAYS.format(ROW.format(105)), 0, ""),
    "missed by 11 %": (SAYS.format(ROW.format(111)), 1, "peak: 111 MiB, to be at most 100 MiB: missed by 11 %"),
    "crashes": (SAYS.format(ROW.format(1)) + "; kill -SEGV $$", 1, "exit status -11"),
    "prints nothing": (SAYS.format(ROW.format(1)).replace("echo text;", ""), 1, "prints nothing"),
    "no rows": ("echo text", 1, "no row"),
    "half a row": (SAYS.format("peak\\t1\\tMiB"), 1, "a row that is not one"),
    "no number": (SAYS.format(ROW.format("nan")), 1, "a row that is not one"),
    "two of a name": (SAYS.format(ROW.format(1) * 2), 1, "two rows of one name"),
    "another row": (SAYS.format(ROW.format(1).replace("peak", "time")), 1, "no longer measured: peak"),
}


class Performance(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="tally-performance-")
        self.addCleanup(folder.cleanup)
        self.top = pathlib.Path(folder.name)
        self.table = self.top / "performance.json"
        (self.top / "scripts").mkdir()

    def run_fake(self, name, does, names=()):
        program = self.top / "scripts" / name
        program.write_text(f"#!/bin/sh\n{does}\n")
        program.chmod(0o755)
        benchmarks = [Benchmark(each, f"Of {each}", "What it does.") for each in ("first", "second")]
        said = io.StringIO()
        with contextlib.redirect_stderr(said), contextlib.redirect_stdout(io.StringIO()):
            status = measure.run(benchmarks, set(names or [name]), self.top, self.table)
        return status, said.getvalue()

    def test_the_page_is_what_the_table_generates(self):
        entries = json.loads(TABLE.read_text())
        self.assertEqual(page.generate(BENCHMARKS, entries), TABLE.with_suffix(".md").read_text(), "scripts/bench --page")
        shuffled = json.loads(json.dumps(dict(reversed(entries.items()))))
        self.assertEqual(page.generate(BENCHMARKS, shuffled), page.generate(BENCHMARKS, entries))
        names = [row["name"] for entry in entries.values() for row in entry["rows"]]
        self.assertEqual(len(names), len(set(names)))

    def test_exit_statuses(self):
        for name, (does, expected, says) in FAKES.items():
            with self.subTest(name):
                self.table.unlink(missing_ok=True)
                self.run_fake("first", SAYS.format(ROW.format(7)))
                self.run_fake("second", SAYS.format(ROW.format(8).replace("peak", "second peak")))
                before = json.loads(self.table.read_text())
                status, said = self.run_fake("first", does)
                self.assertEqual(status, expected)
                self.assertIn(says, said) if says else self.assertEqual(said, "")
                after = json.loads(self.table.read_text())
                self.assertEqual(after["second"], before["second"])
                # What fails leaves the former figures; a missed target is written down.
                written = expected == 0 or "to be" in says or "no longer" in says
                self.assertEqual(after["first"] != before["first"], written)
                self.assertIn("1 of 2" if name.startswith("missed") else "2 of 2", self.table.with_suffix(".md").read_text())

    def test_ratios(self):
        for figure, ratio, verdict in [
                ((2, "s", times_less(60), ("script", 120)), 60, "met"),
                ((2, "s", times_less(60), ("script", 108)), 54, "missed by 10 %"),
                ((2, "s", times_less(60), ("script", 107)), 53.5, "**missed by 11 %**"),
                ((3, "s", at_most(1.5), ("reading", 2)), 1.5, "met"),
                ((6, "lines/s", at_least(1)), 6, "met"),
                ((0, "lost", at_most(0)), 0, "met"), ((1, "lost", at_most(0)), None, "**missed**"),
                ((3, "s"), None, ""), ((0, "s", times_less(2), ("script", 1)), "unreadable", "")]:
            with self.subTest(figure), tempfile.NamedTemporaryFile("r") as file:
                with unittest.mock.patch.dict("os.environ", BENCH_FIGURES=file.name):
                    add_figure("name", *figure)
                if ratio == "unreadable":
                    self.assertRaises(rows.Unreadable, rows.parse_all, file.read())
                    continue
                row, = rows.parse_all(file.read())
                self.assertEqual((row["ratio"], rows.verdict(row)), (ratio, verdict))


if __name__ == "__main__":
    unittest.main()
