#!/usr/bin/env python3
"""compare_rows.py FILE FILE: whether two files of NDJSON hold the same rows."""
import json
import sys

ours, theirs = ([json.loads(line) for line in open(path)] for path in sys.argv[1:])
sys.exit(ours != theirs or not ours)
