"""Questions about a fleet: both engines find what is in the data, agree, and tell nothing of few devices."""
import math
import pathlib
import random
import re
import shutil
import signal
import subprocess
import tempfile
import unittest
from fractions import Fraction

import fleet
from fleet import DAY, K, ask, local_servers, log, samples, tool
from installed import TOP, main_with_optional_clients
from test_schemas import validators

QUESTIONS = [("distribution", {"key": "fleet.wakeups"}), ("distribution", {"key": "fleet.distribution.0"}),
             ("regression", {"key": "fleet.wakeups"}), ("wear", {"key": "fleet.wear", "limit": 90000}),
             ("silence", {}), ("coverage", {"days": 28})]
LOADED = {"loaded": 0, "resumed": 0, "duplicate": 0, "conflict": 0, "bare": 0, "undated": 0, "unreadable": 0}


@unittest.skipUnless(fleet.HAS_DUCKDB, "npm's @duckdb/node-api is not installed")
class Fleet(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-fleet-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)

    def data(self, **files):
        """A directory of exported files; they count in the order of their names."""
        directory = pathlib.Path(tempfile.mkdtemp(dir=self.folder))
        for name, text in files.items():
            (directory / f"{name}.ndjson").write_text(text)
        return directory

    def assertSame(self, one, other, what=None):
        """Sums may differ in the order in which an engine adds up."""
        if isinstance(one, float) and isinstance(other, (int, float)):
            self.assertAlmostEqual(one, other, delta=1e-12 * abs(one), msg=what)
        elif isinstance(one, list) and isinstance(other, list):
            self.assertEqual(len(one), len(other), what)
            for mine, others in zip(one, other):
                self.assertSame(mine, others, what or mine)
        else:
            self.assertEqual(one, other, what)

    def check(self, schema, document):
        for validator in validators(schema):
            validator.validate(document)

    def generated(self):
        directory = self.folder / "generated"
        if not directory.exists():
            subprocess.run(["node", TOP / "bench/fleet/generate.mjs", directory, "400", "30", "12"], check=True)
        return directory

    def untidy(self):
        """What happens to logs on their way: K + 10 devices on four days, and each fault once for each of K."""
        devices = range(1, K + 11)
        first = [log(device, number + 1, DAY - 3 + number, ("key", 100 * device + number), ("other", 1))
                 for device in devices for number in range(3) if not (number == 1 and device <= K)]  # lost
        again = [log(device, 1, DAY - 3, ("key", 100 * device), ("other", 1)) for device in range(1, K + 1)]
        differs = [log(device, 3, DAY, ("key", 1), ("third", 1), version="9") for device in range(1, K + 1)]
        odd = [log(device, 4, None, ("key", 7)) for device in range(1, K + 1)] + \
              [log(None, None, DAY - 1, ("key", number)) for number in range(K)]
        last = [log(device, 5, DAY, ("key", device), ("other", 1)) for device in devices]
        future = log(1, 6, DAY + 4000, ("key", 5))  # a clock that is wrong
        rows = log(2, 6, DAY, ("key", 2), ("odd", 3), ("other", samples(1, 1, 1))).replace('"3"', "3x").replace('"count":1', '"count":"x"')
        broken = '{"schema":1,"device":"x"}\nno JSON\n' + log(1, 7, DAY + 1, ("key", 5)).replace('"schema":1', '"schema":2')
        return self.data(a="".join(first), b="".join(again + differs + odd) + broken, c="".join(last) + future + rows + '{"schema":1,')

    def test_finds_what_is_in_the_data(self):
        data = self.generated()
        rows = {row["test"]: row for row in ask("regression", data=data, key="fleet.wakeups").rows}
        self.assertFalse(rows["typical"]["found"], "12 of 400 devices wake up twice as often")
        self.assertTrue(rows["paired"]["found"])
        # Twelve are fewer than K: that they exist is told, how many is not.
        self.assertEqual([rows["paired"][name] for name in ("value_baseline", "value_candidate", "difference")], 3 * [None])
        silent = ask("silence", data=data).rows
        self.assertEqual([(row["key"], row["silent"], row["last"]) for row in silent], [("fleet.silent", 400, "2026-11-11")])
        wear = ask("wear", data=data, key="fleet.wear", limit=90000)
        # Rates from 0.02 to 0.06 a day, evenly: half of the devices are faster than 0.04, from 20 % on day 0.
        self.assertRegex(wear.only(share=0.5)["date"], r"2031-0[6-9]")
        self.assertEqual([wear.only(share=share)["method"] for share in (0.01, 0.5)], ["extrapolated", "counted"])
        no_key = ask("distribution", data=data, key="'; DROP TABLE rows; --\\' @uniq(x) {k}")
        self.assertEqual((no_key.rows, no_key.all["withheld"]), ([], 0))

    def test_statistics_are_those_of_the_tables(self):
        cases = {"studentQuantile95(10)": 2.228138852, "normalQuantile(0.01)": -2.326347874, "signTest(6, 0)": 0.03125,
                 "studentTwoSided(2.228138852, 10)": 0.05, "shareDifference(48, 80, 56, 70).low": 0.0524,
                 "shareDifference(48, 80, 56, 70).high": 0.3339}
        script = f"import * as s from '{TOP}/fleet/lib/statistics.mjs';" \
                 f"console.log(JSON.stringify([{','.join('s.' + case for case in cases)}]))"
        printed = subprocess.run(["node", "--input-type=module", "-e", script], check=True, capture_output=True).stdout
        for (case, expected), found in zip(cases.items(), fleet.json.loads(printed)):
            self.assertAlmostEqual(expected, found, 4, case)

    def test_logs_that_are_lost_repeated_or_unreadable(self):
        answer = ask("coverage", data=self.untidy())
        whole = answer.only(date=None, version=None)
        expected = {"devices": K, "lost": K, "duplicates": K, "conflicts": K, "undated": K, "bare": K, "unreadable": 4}
        self.assertEqual({name: whole[name] for name in expected}, expected)
        self.assertEqual(answer.all["until"], "2026-11-25", "one wrong clock does not move the last day")
        # The first of two logs with one number counts: nothing of the other is left.
        versions = {row["version"] for row in answer.rows}
        self.assertEqual(versions, {None, "1.0"})

    def test_merges_exactly(self):
        """Means of 1e9 that differ by their last bits: sums of squares would find no variance, or one that is
        far from it, as seen through the rounding."""
        number = random.Random(5)
        cases = {"near": lambda: (number.randint(1, 2**32 - 1), 1e9 + number.random() * 1e-5, number.random() * 1e-7),
                 "far": lambda: (number.randint(1, 9), number.choice([-1, 1]) * 10 ** number.uniform(-5, 150), 1.0),
                 "plain": lambda: (number.randint(1, 9), number.gauss(5, 1), number.random())}
        logs = {key: [make() for _ in range(K + 30)] for key, make in cases.items()}
        data = self.data(a="".join(log(device, 1, DAY, *((key, samples(*logs[key][device])) for key in logs))
                                   for device in range(K + 30)))
        with self.engines(data) as engines:
            for key, values in logs.items():
                count = sum(n for n, _, _ in values)
                mean = sum(n * Fraction(m) for n, m, _ in values) / count
                squares = sum(Fraction(s) + n * (Fraction(m) - mean) ** 2 for n, m, s in values)
                for where in engines:
                    row = ask("distribution", key=key, **where).only(version=None)
                    # Half a step, of up to 2.5 times what √K devices may move or the standard error.
                    deviation, moves = float(squares / count) ** 0.5, [abs(float(n * (Fraction(m) - mean))) for n, m, _ in values]
                    error = max(math.hypot(*moves), K**0.5 * max(moves))
                    self.assertLess(abs(row["samples"] - count), 1.25 * K * count / len(values))
                    self.assertLess(abs(row["mean"] - float(mean)), 1.3 * error / count, (key, where))
                    part = max(max(float(s + n * (Fraction(m) - mean) ** 2), n * deviation**2) for n, m, s in values)
                    self.assertLess(abs(row["deviation"] - deviation), 1.3 * K**0.5 * part / count / 2 / deviation, (key, where))

    def test_tells_nothing_of_few_devices_nor_by_subtraction(self):
        sizes = {"small beside large": [30, 20, 10, 120], "small pulls another": [40, 70, 120], "one small": [3, 200],
                 "none small": [60, 70], "all small": [20, 20]}
        lonely = {"lower": [None, 10, 20], "upper": [10, 20, None], "counts": [5, 3, 1]}
        common = {"lower": [None, 10], "upper": [10, 20], "counts": [5, 4]}
        for name, versions in sizes.items():
            devices = [version for version, size in enumerate(versions) for _ in range(size)]
            data = self.data(a="".join(
                log(device, 1, DAY, ("d", samples(9, 5 + device % 7, 1.0, **(lonely if device % 50 == 0 else common))),
                    version=f"{version}") for device, version in enumerate(devices)))
            with self.subTest(name):
                told = ask("distribution", data=data, key="d")
                if sum(versions) < K:
                    self.assertEqual(told.rows, [])
                    continue
                whole = told.only(version=None)
                named = [row for row in told.rows if row["version"] is not None]
                hidden = sum(versions) - sum(versions[int(row["version"])] for row in named)
                self.assertTrue(hidden == 0 or hidden >= K, hidden)
                self.assertEqual(whole["samples"] % 500, 0, "50 devices have 450 samples")
                self.assertEqual(told.all["withheld"], len(versions) - len(named))
                for row in told.rows:
                    self.assertEqual(row["devices"] % K, 0)
                    self.assertEqual((row["lower"], row["upper"]), ([None, 10], [10, None]))
                    self.assertIsNone(row["p1"])
                for row in ask("coverage", data=data).rows:
                    self.assertTrue(row["devices"] >= K and row["devices"] % K == 0 and row["logs"] % K == 0)
        # A few devices that lack a histogram, or send a scalar, do not show as the difference of two sums.
        few = {"no histogram": samples(9, 5, 1.0), "a scalar": 5}
        for name, row in few.items():
            data = self.data(a="".join(log(device, 1, DAY, ("d", samples(9, 5, 1.0, **common) if device % 50 else row))
                                       for device in range(150)))
            row = ask("distribution", data=data, key="d").only(version=None)
            self.assertEqual((row["devices"], row["counts"], row["samples"]), (150, None, None if name == "a scalar" else 1500))
        # One device with buckets of its own neither moves those of the others nor shows.
        data = self.data(a="".join(log(device, 1, DAY, ("d", samples(9, 5, 1.0, **(common if device > 1 else {
            "lower": [7, 90], "upper": [13, 100], "counts": [5, 4]})))) for device in range(1, 151)))
        row = ask("distribution", data=data, key="d").only(version=None)
        self.assertEqual((row["lower"], row["upper"]), ([None, 10], [10, None]))
        # One of the devices of version A is in a bucket in which all others are of version B.
        data = self.data(a="".join(
            log(device, 1, DAY, ("d", samples(12, 9, 1, lower=[None, 10], upper=[10, 20], counts=[7, 5]) if device == 1 or device > 100
                                 else samples(5, 15, 1, lower=[10], upper=[20], counts=[5])),
                ("w", 1000 * device), version="A" if device <= 100 else "B") for device in range(1, 221)))
        rows = ask("distribution", data=data, key="d").rows
        self.assertEqual([(row["version"], row["lower"], row["upper"]) for row in rows],
                         [(version, [None], [20]) for version in (None, "A", "B")])
        for wrong in ("days=8", "device=1", "limit"):
            self.assertIn("tallyfleet: ", tool("ask", "coverage", "--data", data, "--param", wrong,
                                               status=2 if wrong == "limit" else 1))

    def test_wear_has_no_bounds_of_one_s_own(self):
        data = self.data(a="".join(log(device, number + 1, DAY - 9 + number, ("w", device * 997 % 90000 + 10 * device * number))
                                   for device in range(1, 241) for number in range(10)))
        for limit in (90000, 40000):
            buckets = [row for row in ask("wear", data=data, key="w", limit=limit).rows if row["what"] == "wear"]
            self.assertEqual((buckets[0]["from"], buckets[-1]["to"]), (None, None))
            for one, other in zip(buckets, buckets[1:]):
                self.assertEqual((one["to"], one["to"] % 10000), (other["from"], 0))
        self.assertIn("limit", tool("ask", "wear", "--data", data, "--param=key=w", "--param=limit=41234", status=1))

    def test_forgets_logs_without_a_number_and_devices_of_any_name(self):
        data = self.data(a=log(1, None, DAY, ("key", 1)) + log(1, 1, DAY, ("key", 1)) +
                         log(2, None, DAY, ("key", 1)).replace(f"{2:032x}", "kitchen") +
                         "".join(log(device, 1, DAY, ("key", 1)) + log(device, 2, day, ("key", 1))
                                 for device, day in zip(range(3, 3 + K), [60000, -1] * K)))
        with self.engines(data) as engines:
            for where in engines:
                whole = ask("coverage", **where).only(date=None, version=None)
                self.assertEqual((whole["undated"], whole["unreadable"]), (K, None), "days out of range")
            for where in engines:
                for device in (f"{1:032x}", "kitchen"):
                    tool("forget", device, *(("--data", data) if "data" in where else ("--server", where["server"].address)))
            self.assertNotRegex((data / "a.ndjson").read_text(), f"kitchen|{1:032x}")
            for where in engines[1:]:
                self.assertEqual(where["server"].query("SELECT uniq(device), count() FROM tally.logs"), f"{K}\t{2 * K}\n")

    def test_converted_files_answer_alike_and_are_not_used_when_old(self):
        for data, questions in ((self.generated(), QUESTIONS),
                                (self.untidy(), [("coverage", {}), ("distribution", {"key": "key"})])):
            copy = pathlib.Path(shutil.copytree(data, self.folder / f"copy-{data.name}"))
            tool("convert", copy)
            for question, parameters in questions:
                answer = ask(question, data=copy, **parameters).all
                self.assertEqual(answer, ask(question, data=data, **parameters).all)
                self.check("fleet-ask-1", answer)
        (copy / "d[1].ndjson").write_text("".join(log(device, 1, DAY, ("new", 1)) for device in range(1000, 1000 + K)))
        self.assertEqual(len(ask("distribution", data=copy, key="new").rows), 2)
        tool("convert", copy)
        for file in copy.glob("*.ndjson"):
            file.unlink()
        (copy / "new[1].ndjson").write_text(log(1, 1, DAY, ("new", 1)))
        for command in (("ask", "coverage", "--data", copy), ("convert", copy)):
            self.assertIn("is gone", tool(*command, status=1), "or the Parquet files' data would be")
        (copy / "new[1].ndjson").unlink()
        (copy / "parquet").rename(copy / ".parquet.former")  # as if a conversion had been switched off
        tool("forget", f"{1000:032x}", "--data", copy)
        self.assertEqual(ask("distribution", data=copy, key="new").rows, [], "one device fewer than K")

    def run_document(self, address=None):
        """The commands of docs/fleet.md that take files, or those that take a server."""
        folder = pathlib.Path(tempfile.mkdtemp(dir=self.folder))
        shutil.copytree(self.generated(), folder / "exported")
        lines = re.findall(r"^node fleet/tallyfleet.mjs (.*)$", (TOP / "docs/fleet.md").read_text(), re.MULTILINE)
        for line in lines:
            if ("--server" in line) == (address is not None):
                tool(*line.replace("exported", str(folder / "exported")).replace("localhost:8123", address or "").split())

    def test_the_document_s_commands_run(self):
        self.run_document()

    def engines(self, data):
        """What ask takes for DuckDB and, if there is one, for a server that has loaded the same."""
        return Engines(self.folder, data)

    @unittest.skipUnless(local_servers.available(), "ClickHouse is not installed")
    def test_servers_answer_as_duckdb_does(self):
        data, untidy = self.generated(), self.untidy()
        with tempfile.TemporaryDirectory(dir=self.folder) as folder, local_servers.running(f"{folder}/one") as (one,), \
                local_servers.running(f"{folder}/two", 2) as shards:
            self.run_document(one.address)
            one.query("DROP DATABASE tally")
            tool("schema", "--server", one.address)
            for shard in shards:
                tool("schema", "--server", shard.address, "--cluster", "fleet")
            # Two loaders at once, one of which is killed; then again from the other shard.
            victim = subprocess.Popen(["node", fleet.TOOL, "load", "--server", shards[0].address, data],
                                      stdout=subprocess.DEVNULL)
            other = subprocess.Popen(["node", fleet.TOOL, "load", "--server", shards[1].address, data],
                                      stdout=subprocess.DEVNULL)
            while victim.poll() is None and shards[0].query("SELECT count() FROM tally.rows") == "0\n":
                pass
            victim.send_signal(signal.SIGKILL)
            victim.wait()
            self.assertEqual(other.wait(200), 0)
            for server in (shards[1], one):
                tool("load", "--server", server.address, data)
            halves = [int(shard.query("SELECT uniq(device) FROM tally.rows")) for shard in shards]
            self.assertTrue(all(halves) and sum(halves) == 400, halves)
            for question, parameters in QUESTIONS:
                expected = ask(question, data=data, **parameters)
                for server in (one, *shards):
                    self.assertSame(expected.all["rows"], ask(question, server=server, **parameters).all["rows"], question)
            tool("forget", f"{5:032x}", "--server", one.address)
            self.assertEqual(one.query("SELECT uniq(device) FROM tally.rows"), "399\n")
            one.query("DROP DATABASE tally")
            tool("schema", "--server", one.address)
            self.assertIn("no exported files", tool("load", "--server", one.address, folder, status=1))
            told = tool("load", "--server", one.address, untidy, "--json")
            self.check("fleet-load-1", fleet.json.loads(told))
            self.assertEqual(fleet.json.loads(told), {**LOADED, "loaded": 4 * (K + 10) - K + 2, "duplicate": K, "conflict": K,
                                                      "bare": K, "undated": K, "unreadable": 5})
            self.assertSame(ask("distribution", data=untidy, key="key").all["rows"],
                            ask("distribution", server=one, key="key").all["rows"])


class Engines:
    def __init__(self, folder, data):
        self.data = data
        self.folder = tempfile.TemporaryDirectory(dir=folder)
        self.running = local_servers.running(self.folder.name) if local_servers.available() else None

    def __enter__(self):
        if self.running is None:
            return [{"data": self.data}]
        server, = self.running.__enter__()
        tool("schema", "--server", server.address)
        tool("load", "--server", server.address, self.data)
        return [{"data": self.data}, {"server": server}]

    def __exit__(self, *failure):
        if self.running is not None:
            self.running.__exit__(*failure)
        self.folder.cleanup()


if __name__ == "__main__":
    main_with_optional_clients()
