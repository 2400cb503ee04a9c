#!/usr/bin/env python3
"""import_rows.py CSV DATABASE: the yardstick of bench_import, one row per sample."""
import csv
import sqlite3
import sys

with open(sys.argv[1], newline="") as file, sqlite3.connect(sys.argv[2]) as database:
    database.execute("CREATE TABLE rows(kind TEXT, key TEXT, day INTEGER, offset INTEGER, value REAL)")
    rows = csv.reader(file)
    next(rows)
    database.executemany("INSERT INTO rows VALUES (?, ?, ?, ?, ?)", rows)
