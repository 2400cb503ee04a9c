"""Exported rows of made-up fleets, and the tool that asks engines about them."""
import datetime
import json
import os
import shutil
import subprocess
import sys

from installed import BUILD, TOP

TOOL = TOP / "fleet/tallyfleet.mjs"
MODULES = BUILD / "npm-clients/node_modules"
DAY = 20782  # 2026-11-25
K = json.loads((TOP / "fleet/settings.json").read_text())["K"]
HAS_DUCKDB = shutil.which("node") is not None and (MODULES / "@duckdb/node-api/package.json").exists()

sys.path.insert(0, str(TOP / "fleet/clickhouse"))
import local_servers  # noqa: E402, pylint: disable=wrong-import-position


def tool(*arguments, status=0):
    result = subprocess.run(["node", TOOL, *map(str, arguments)], env={**os.environ, "NODE_PATH": str(MODULES)},
                            capture_output=True, text=True, timeout=280)
    assert result.returncode == status, (arguments, result.stderr[-2000:])
    return result.stderr if status else result.stdout


class Answer:
    def __init__(self, text):
        self.all = json.loads(text)
        self.rows = [dict(zip(self.all["columns"], row)) for row in self.all["rows"]]

    def only(self, **wanted):
        found = [row for row in self.rows if all(row[name] == value for name, value in wanted.items())]
        assert len(found) == 1, (wanted, self.rows)
        return found[0]


def ask(question, *, data=None, server=None, **parameters):
    where = ["--data", data] if data else ["--engine", "clickhouse", "--server", server.address]
    return Answer(tool("ask", question, *where, "--json", *(f"--param={name}={value}" for name, value in parameters.items())))


def log(device, sequence, day, *rows, version="1.0"):
    """The lines of one log; a row is (key, value) or (key, members of a distribution)."""
    head = {"schema": 1, "device": device if device is None else f"{device:032x}", "sequence": sequence, "day": day,
            "date": None if day is None else str(datetime.date(1970, 1, 1) + datetime.timedelta(day)),
            "system_version": version, "configuration": None, "log_version": 1, "whitelist": "0" * 32}
    lines = []
    for key, value in rows:
        content = {"kind": "distribution", **value} if isinstance(value, dict) else {"kind": "scalar", "value": str(value)}
        lines.append(json.dumps({**head, "key": key, **content}, separators=(",", ":")) + "\n")
    return "".join(lines)


def samples(count, mean, squares, **histogram):
    return {"count": count, "minimum": mean - 1, "maximum": mean + 1, "mean": mean, "squared_deviations": squares, **histogram}
