#!/usr/bin/env python3
"""compare_logs.py LOG EXPECTED: succeeds when every entry that the second has is in the first."""
import plistlib
import sys

log, expected = (plistlib.load(open(path, "rb")) for path in sys.argv[1:])
different = [key for key in expected if log.get(key) != expected[key]]
print("the log differs in " + ", ".join(different) if different else "the logs are equal")
sys.exit(1 if different else 0)
