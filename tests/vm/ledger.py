"""What a machine acknowledged, and whether its files hold it and are whole."""
import collections
import contextlib
import csv
import json
import os
import pathlib
import plistlib
import sqlite3
import subprocess

from machine import TOP

# What each tasking sets, to its own number.
TASKED = [("mobile", "vm.tasked", "first"), ("mobile", "vm.other", "second"), ("__sysmetra__", "vm.tasked", "third"),
          ("guest", "vm.tasked", "fourth")]
RUNS = ("tasking", "report", "day")  # these actions are runs of the daily job
IMPORTED = 100  # rows
KEPT_DAYS = 25  # the store keeps 30 with data; each boot is a day
KEPT_LOGS = 40


class Files:
    """The files of a device; what is not whole is among the faults."""

    def __init__(self, root):
        self.root, self.library = root, root / "var/mobile/Library"
        self.faults = [f"set aside: {path}" for path in root.rglob("*.damaged-*")]
        self.samples, self.scalars = [], {}
        if (self.library / "Tallybook/TBDataStore.sqlitedb").exists():
            self.read_store(self.library / "Tallybook/TBDataStore.sqlitedb")
        logs = sorted((self.library / "Logs/Submission").glob("*-log-tallyd.log"))
        self.reports = [self.read(log).get("TBScalars", {}) for log in logs]
        for path in [*(log.with_suffix(".info.plist") for log in logs),
                     *(self.library / "Logs/StructuredData").glob("*.plist")]:
            self.read(path)
        for path in (self.library / "Logs/AnalyticsEvents").glob("*.jsonl"):
            for line in path.read_bytes().split(b"\n")[:-1]:  # a line without an end is the next writer's to remove
                self.attempt(json.loads, line, path)
        self.preferences = {path.relative_to(root): self.read(path) for pattern in ("vellum.tally*", "vm.*")
                            for path in root.glob(f"**/Library/Preferences/{pattern}.plist")}

    def attempt(self, parse, content, path):
        try:
            return parse(content)
        except Exception as error:  # parsers raise whatever they like
            self.faults.append(f"{path.relative_to(self.root)} is not whole: {error!r}")
            return {}

    def read(self, path):
        return self.attempt(lambda file: plistlib.loads(file.read_bytes()), path, path)

    def read_store(self, path):
        with contextlib.closing(sqlite3.connect(path)) as store:
            check = self.attempt(lambda sql: store.execute(sql).fetchall(), "PRAGMA integrity_check", path)
        dump = subprocess.run([TOP / "build/bin/tallyctl", "--root", self.root, "store", "dump"],
                              capture_output=True, text=True, env={**os.environ, "TALLYRUN_LOG": "stderr"})
        if check != [("ok",)] or dump.returncode != 0 or dump.stderr:
            self.faults.append(f"the store is not whole: {check}; {dump.stderr.strip()}")
        for row in csv.DictReader(dump.stdout.splitlines()):
            if row["kind"] == "scalar":
                self.scalars[row["key"], int(row["day"])] = int(row["value"])
            else:
                self.samples.append((int(row["day"]), float(row["value"])))

    def preference(self, user, domain, key):
        home = "" if user == "__sysmetra__" else f"var/{user}/"
        return self.preferences.get(pathlib.Path(f"{home}Library/Preferences/{domain}.plist"), {}).get(key)

    def own(self, key):
        return self.preference("mobile", "vellum.tallyd.tallyrun", key)

    def tasking(self):
        """In force, or on its way."""
        return (self.own("TaskingUnfinished") or {}).get("TaskingID") or self.own("TaskingID")


class Action:
    def __init__(self, kind, number, day):
        self.kind, self.number, self.day, self.done = kind, number, day, False

    def __str__(self):
        return f"{self.kind} {self.number}"

    def parts(self, files):
        """How many of its parts the files hold, and how many it has. Later actions have higher numbers."""
        number, before = self.number, self.day - 1
        rows = {"set": [f"vm.set.{number}"], "import": [f"vm.import.{number}.{row}" for row in range(1, IMPORTED + 1)]}
        if self.kind in rows:
            return sum(files.scalars.get((key, before)) == number for key in rows[self.kind]), len(rows[self.kind])
        if self.kind == "push":
            return sum((before, number + part) in files.samples for part in (0, 0.25, 0.5)), 3
        latest = {"prefs": files.preference("mobile", "vm.own", "number"), "tasking": files.tasking(),
                  "report": number if any(f"vm.set.{number}" in log for log in files.reports) else 0,
                  "day": files.own("LastCrashLogSerializationDateInDaysSince1970")}
        return int(latest[self.kind] or 0) >= (before if self.kind == "day" else number), 1


class Ledger:
    def __init__(self):
        self.actions, self.swept = [], {}
        self.interrupted_run = False

    def read(self, answers, day):
        """Takes the answers of a boot; the action that was interrupted, if any."""
        for answer in answers:
            word, *what = answer.split()
            if word == "try":
                self.actions.append(Action(what[0], int(what[1]), day))
            elif word == "done":
                self.actions[-1].done = True
            if what and what[0] in RUNS:
                self.interrupted_run = word == "try"
        return [action for action in self.actions[-1:] if not action.done]

    def check(self, files, day):
        """Lines that say what is lost or not whole."""
        faults, runs = list(files.faults), 0
        for action in reversed(self.actions):
            runs += action.kind in RUNS
            expired = runs > KEPT_LOGS - 5 if action.kind in RUNS else action.day <= day - KEPT_DAYS
            found, whole = action.parts(files)
            if not expired and found != whole and (action.done or found):
                faults.append(f"{'lost' if action.done else 'half'}: {action}, {int(found)} of {whole} parts")
        # What was interrupted is there from now on, or never will be.
        self.actions = [action for action in self.actions if action.done]
        return faults + self.check_sweeps(files) + self.check_tasking(files)

    def check_sweeps(self, files):
        """A sweep is in the store as a whole; what it finds depends on whether the day is even."""
        counts = collections.Counter(day for key, day in files.scalars if not key.startswith("vm."))
        wanted = {action.day for action in self.actions if action.kind in RUNS}
        faults = [f"lost: the sweep of day {day}" for day in wanted - set(counts) if day > max(wanted) - KEPT_DAYS]
        return faults + [f"half: {count} values of the sweep of day {day}" for day, count in counts.items()
                         if self.swept.setdefault(day % 2, count) != count]

    def check_tasking(self, files):
        if files.own("TaskingUnfinished"):
            return [] if self.interrupted_run else ["half: a tasking is unfinished after an acknowledged run"]
        values = {files.preference(*preference) for preference in TASKED}
        return [] if values == {files.tasking()} else [f"half: tasking {files.tasking()} set {values}"]
