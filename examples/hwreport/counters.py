#!/usr/bin/env python3
"""Prints the statistics channels of a device (TALLYRUN_ROOT, or /) from Python.
counters.py [SECONDS [GROUP]]: what they counted meanwhile, and only those of one group."""
import sys
import time
from ctypes import CDLL, POINTER, byref, c_char_p, c_int, c_int64, c_size_t, c_uint64, c_void_p

# The constants of hwreport_c.h.
NAME, DRIVER_NAME, UNIT_LABEL = 1, 4, 5
FORMAT = 1
SIMPLE, STATE, HISTOGRAM, ARRAY = 1, 2, 3, 4
MISSING = -1 << 63
COLUMNS = {STATE: 4, HISTOGRAM: 5, ARRAY: 1}  # residencies, hits, values

library = CDLL("libhwreport.so.0")
HANDLE, OUT = c_void_p, POINTER(c_void_p)
for function, arguments in {
        "open": [c_char_p, OUT], "close": [HANDLE], "list": [HANDLE, OUT], "free": [HANDLE], "count": [HANDLE],
        "keep_group": [HANDLE, c_char_p, c_char_p], "subscribe": [HANDLE, HANDLE, OUT], "unsubscribe": [HANDLE],
        "sample": [HANDLE, OUT], "delta": [HANDLE, HANDLE, OUT],
        "text": [HANDLE, c_size_t, c_int, POINTER(c_char_p)],
        "number": [HANDLE, c_size_t, c_int, POINTER(c_uint64)],
        "simple_value": [HANDLE, c_size_t, POINTER(c_int64)],
        "elements": [HANDLE, c_size_t, c_int, POINTER(c_int64), c_size_t, POINTER(c_size_t)],
        "state_name": [HANDLE, c_size_t, c_size_t, POINTER(c_char_p)]}.items():
    getattr(library, f"hwreport_{function}").argtypes = arguments
for function in ("close", "free", "unsubscribe"):
    getattr(library, f"hwreport_{function}").restype = None
library.hwreport_count.restype = c_size_t
library.hwreport_error_text.restype = c_char_p


def got(kind, function, *arguments):
    """What a function stores through its last parameter."""
    result = kind()
    if getattr(library, f"hwreport_{function}")(*arguments, byref(result)) != 0:
        raise OSError(library.hwreport_error_text().decode())
    return result.value


def text(channels, function, *arguments):
    result = c_char_p()
    getattr(library, f"hwreport_{function}")(channels, *arguments, byref(result))
    return result.value.decode()  # "" if the channel has none


def column(channels, index, what):
    count = got(c_size_t, "elements", channels, index, what, None, 0)
    values = (c_int64 * count)()
    got(c_size_t, "elements", channels, index, what, values, count)
    return list(values)


def lines(channels, index):
    label = f"{text(channels, 'text', index, DRIVER_NAME)}: {text(channels, 'text', index, NAME)}"
    kind = got(c_uint64, "number", channels, index, FORMAT)
    if kind == SIMPLE:
        value = got(c_int64, "simple_value", channels, index)
        return [f"{label} = {value} {text(channels, 'text', index, UNIT_LABEL)}"]
    result = []
    for i, value in enumerate(column(channels, index, COLUMNS[kind])):
        if value == MISSING:
            continue
        state = text(channels, "state_name", index, i) if kind == STATE else ""
        result.append(f"{label}[{i}] {state} = {value}")
    return result


def main():
    device = got(c_void_p, "open", None)
    channels = got(c_void_p, "list", device)
    if len(sys.argv) > 2 and library.hwreport_keep_group(channels, sys.argv[2].encode(), None) != 0:
        raise OSError(library.hwreport_error_text().decode())
    subscription = got(c_void_p, "subscribe", device, channels)
    sample = got(c_void_p, "sample", subscription)
    if len(sys.argv) > 1:
        time.sleep(int(sys.argv[1]))
        earlier, later = sample, got(c_void_p, "sample", subscription)
        sample = got(c_void_p, "delta", earlier, later)
        library.hwreport_free(earlier)
        library.hwreport_free(later)
    for index in range(library.hwreport_count(sample)):
        print("\n".join(lines(sample, index)))
    library.hwreport_free(sample)
    library.hwreport_unsubscribe(subscription)
    library.hwreport_free(channels)
    library.hwreport_close(device)


try:
    main()
except OSError as error:
    sys.exit(str(error))
