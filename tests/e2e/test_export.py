"""Exported rows: those that an independent reader makes of the same logs, in every format, and as the schema says."""
import collections
import csv
import io
import json
import plistlib
import re
import subprocess
import sys
import unittest

from device import BIN, SPOOL, TODAY, DeviceTest, group
from installed import TOP, main_with_optional_clients

try:
    import jsonschema
except ImportError:
    jsonschema = None

PSEUDONYM = "0123456789abcdef" * 2
INTERVALS = {"d": {"intervals": [-2, 0.5, 10, 1e22]}, "plain": {}}
SAMPLES = [-3.25, 0.25, 0.5, 7.0, 7.0, 1e23]


class Export(DeviceTest):
    def setUp(self):
        """Logs of three real days, with what the information of a fleet's device says."""
        super().setUp()
        self.device.whitelist(G=group({"a": {}, "=1+1": {}, 'q"\\,\n\u202e': {}}, INTERVALS))
        days = [TODAY - 3, TODAY - 2, TODAY - 1]
        self.device.store([("a", day, -(1 << 63) + day) for day in days],
                          [(key, day, SAMPLES) for key in INTERVALS for day in days])
        for name, value in {"=1+1": 5, 'q"\\,\n\u202e': (1 << 63) - 1}.items():
            self.device.tool("store", "set", "--day", str(days[-1]), "--", name, str(value))
        for day in days:
            self.device.run("-d", day=day + 1)
        self.logs = self.device.log_files()
        self.assertEqual(len(self.logs), 3)
        for number, path in enumerate(self.logs, 7):
            information = {**self.device.info(path), "DevicePseudonym": PSEUDONYM, "SequenceNumber": number,
                           "SystemVersion": "12.5", "Options": {"ConfigNumber": "C-7"}}
            path.with_suffix(".info.plist").write_bytes(plistlib.dumps(information))
        self.spool = self.device.root / SPOOL

    def export(self, *arguments, **options):
        return self.device.tool("report", "export", *arguments, **options)

    def rows(self, *arguments, **options):
        return [json.loads(line) for line in self.export(*arguments, **options).splitlines()]

    def test_an_independent_reader_makes_the_same_rows(self):
        script = subprocess.run([sys.executable, TOP / "bench/yardstick/export_rows.py", self.spool],
                                capture_output=True, check=True).stdout
        wanted = [json.loads(line) for line in script.splitlines()]
        self.assertEqual(self.rows(), wanted)
        self.assertEqual({row["sequence"] for row in wanted}, {7, 8, 9})
        self.assertEqual(self.rows(*map(str, self.logs)), wanted)
        together = b"".join(path.read_bytes() for path in sorted(self.spool.iterdir()) if path.is_file())
        self.assertEqual(self.rows("-", stdin=together), wanted)
        self.assertEqual({"0", "lower"} & {*wanted[-1]}, set(), "a distribution without intervals has no histogram")

        columns = list(csv.DictReader(io.StringIO(self.export("--format", "csv"), newline="")))
        self.assertEqual(len(columns), len(wanted))
        for column, row in zip(columns, wanted):
            self.assertEqual(re.sub("^'", "", column["key"]), row["key"])
            self.assertEqual(column["value"], row.get("value", ""))
            for name in ("lower", "upper", "counts"):
                read = [float(part) if part else None for part in column[name].split(";")] if "counts" in row else None
                self.assertEqual(read, row.get(name), name)
            if row["kind"] == "distribution":
                self.assertEqual([float(column[name]) for name in ("minimum", "mean", "squared_deviations")],
                                 [row[name] for name in ("minimum", "mean", "squared_deviations")])
        self.assertIn("'=1+1", {column["key"] for column in columns})

    def test_what_cannot_be_exported_is_named_and_the_rest_is_exported(self):
        whole = [path.read_bytes() for path in self.logs]
        each = len(self.rows(str(self.logs[0])))
        hidden = whole[0].replace(b"<dict>", b"<dict><!-- </plist> <?xml --><key>c</key><string><![CDATA[</plist><?xml ]]>"
                                  b"</string>", 1)
        self.assertIn(b"<!--", hidden)
        other = plistlib.dumps({"TypeCode": "1", "Name": "other", "DevicePseudonym": "y", "SequenceNumber": 1})
        parts = "TBScalars", "TBDistributions", "TBDistributionsHistogram"
        last = (1 << 53) - 1
        for stream, logs, status in [
                (other + whole[0], 1, 0), (other + b"text\n" + whole[0], 1, 0),
                *((whole[0] + plistlib.dumps({"TBCrashLogVersion": 1, part: []}), 1, 1) for part in parts),
                (whole[0] * 3, 3, 0), (hidden + whole[0], 2, 0), (b"", 0, 0),
                (whole[0][:len(whole[0]) // 2] + whole[0], 1, 1),
                (b"noise" + whole[0] + b"noise\n" + whole[0] + b"noise", 2, 1),
                (b"<plist><dict/></plist>" + whole[0], 1, 1),
                (whole[0] + plistlib.dumps(plistlib.loads(whole[0]), fmt=plistlib.FMT_BINARY), 2, 0)]:
            rows = self.rows("-", "--device", "x", "--sequence", str(last), stdin=stream, status=status)
            self.assertEqual(len(rows), logs * each, stream[:40])
            self.assertEqual([row["sequence"] for row in rows], ([last] * each + [None] * logs * each)[:logs * each])
        self.assertEqual({row["device"] for row in self.rows(str(self.logs[0]), "--device", "x")}, {PSEUDONYM})

        everything = len(self.rows())
        (self.spool / "0000000009-other.log").write_bytes(b"text")
        (self.spool / "0000000009-other.info.plist").write_bytes(plistlib.dumps({"TypeCode": "1", "Name": "other"}))
        for files in [], map(str, self.spool.glob("*.log")):
            self.assertEqual(len(self.rows(*files)), everything, "logs of other kinds are no part of it")
        self.logs[0].write_bytes(whole[0][:-20])
        self.assertEqual(len(self.rows(status=1)), everything - each)
        self.assertEqual(len(self.rows(*map(str, self.logs), status=1)), everything - each)
        with open("/dev/full", "wb") as full:
            self.assertEqual(subprocess.run([BIN / "tallyctl", "report", "export", self.logs[1]], stdout=full,
                                            stderr=subprocess.PIPE, check=False).returncode, 1)

    def check_metrics(self, text, logs):
        lines = text.splitlines()
        self.assertEqual(lines[-1], "# EOF")
        families, series = [], collections.defaultdict(list)
        for line in lines[:-1]:
            if line.startswith("# TYPE "):
                families.append(line.split()[2])
            elif not line.startswith("# HELP "):
                name, labels, value, time = re.fullmatch(r'(\w+)(?:\{((?:\w+="(?:[^"\\]|\\.)*",?)*)\})? (\S+)(?: (\d+))?',
                                                         line).groups()
                self.assertEqual(name, families[-1], "families are contiguous")
                if (name, labels) in series:
                    self.assertEqual((name, labels), last, "and so are metrics")
                last = (name, labels)
                series[last].append((int(time or 0), float(value)))
        self.assertEqual(len(families), len(set(families)))
        for points in series.values():
            self.assertEqual([time for time, _ in points], sorted({time for time, _ in points}))
        self.assertEqual(len(series["tallyrun_scalar", f'device="{PSEUDONYM}",key="a"']), logs)
        buckets = [(float(re.search('le="(.*)"', labels)[1]), points[-1][1]) for (name, labels), points in series.items()
                   if name == "tallyrun_distribution_bucket"]
        self.assertEqual(buckets, [(-2, 1), (0.5, 3), (10, 5), (1e22, 5), (float("inf"), 6)])
        return [time for time, _ in series["tallyrun_scalar", f'device="{PSEUDONYM}",key="a"']]

    def test_open_metrics(self):
        self.assertEqual(self.check_metrics(self.export("--format", "openmetrics"), 1), [0])
        backwards = [*map(str, reversed(self.logs)), str(self.logs[0])]  # one twice
        times = self.check_metrics(self.export("--format", "openmetrics", "--timestamps", *backwards), 3)
        self.assertEqual(times, [(day + 1) * 86400 - 1 for day in range(TODAY - 3, TODAY)])

    @unittest.skipUnless(jsonschema, "needs python3-jsonschema")
    def test_rows_are_as_the_schema_says(self):
        schema = json.loads((TOP / "docs/schema/report-export-1.json").read_text())
        jsonschema.Draft202012Validator.check_schema(schema)
        strict = jsonschema.Draft202012Validator({**schema, "unevaluatedProperties": False})
        log = plistlib.loads(self.logs[0].read_bytes())
        log["TBDistributions"]["odd"] = [float("-inf"), float("inf"), float("nan"), 1.0, 5]
        log["TBDistributionsHistogram"]["odd"] = {"(-inf, inf]": 1, "(nan, inf)": 2}
        del log["TBStartDate"], log["TBWhitelistDigest"]
        rows = self.rows() + self.rows("-", stdin=plistlib.dumps(log, sort_keys=False))
        self.assertEqual([row["not_finite"] for row in rows if row["key"] == "odd"],
                         [["minimum=-inf", "maximum=inf", "mean=nan", "lower[1]=nan"]])
        for row in rows:
            strict.validate(row)
        for change in ({"value": 5}, {"day": "1"}, {"kind": "other"}, {"sequence": 0}):
            with self.assertRaises(jsonschema.ValidationError, msg=change):
                strict.validate({**rows[0], **change})


if __name__ == "__main__":
    main_with_optional_clients()
