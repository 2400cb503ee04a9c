#!/usr/bin/env python3
"""Prints the disks and the flash storage's health from Python (TALLYRUN_ROOT, or /).
health.py [DISK]: of that disk; else of the device's storage."""
import sys
from ctypes import (CDLL, POINTER, byref, c_char_p, c_double, c_int, c_int64, c_size_t, c_uint32, c_uint64,
                    c_void_p)

# The constants of storage_c.h.
HAS_FIGURES = 4
KINDS = {1: (c_int64, "value_int64"), 2: (c_uint64, "value_uint64"), 3: (c_double, "value_double"),
         4: (c_char_p, "value_text")}

library = CDLL("libtallystorage.so.0")
HANDLE, OUT, INDEX, TEXT = c_void_p, POINTER(c_void_p), c_size_t, POINTER(c_char_p)
for function, arguments in {
        "open": [c_char_p, OUT], "close": [HANDLE],
        "list_disks": [HANDLE, OUT], "free_disks": [HANDLE], "disk_count": [HANDLE],
        "disk_name": [HANDLE, INDEX, TEXT], "disk_kind": [HANDLE, INDEX, TEXT],
        "disk_flags": [HANDLE, INDEX, POINTER(c_uint32)],
        "nand_info": [HANDLE, c_char_p, OUT], "nand_health": [HANDLE, c_char_p, OUT],
        "free_values": [HANDLE], "value_count": [HANDLE], "find": [HANDLE, c_char_p, POINTER(c_size_t)],
        "value_name": [HANDLE, INDEX, TEXT], "value_kind": [HANDLE, INDEX, POINTER(c_int)],
        **{name: [HANDLE, INDEX, POINTER(kind)] for kind, name in KINDS.values()}}.items():
    getattr(library, f"tallystorage_{function}").argtypes = arguments
for function in ("close", "free_disks", "free_values"):
    getattr(library, f"tallystorage_{function}").restype = None
for function in ("disk_count", "value_count"):
    getattr(library, f"tallystorage_{function}").restype = c_size_t
library.tallystorage_error_text.restype = c_char_p


def got(kind, function, *arguments):
    """What a function stores through its last parameter."""
    result = kind()
    if getattr(library, f"tallystorage_{function}")(*arguments, byref(result)) != 0:
        raise OSError(library.tallystorage_error_text().decode())
    return result.value.decode() if kind is c_char_p else result.value


def print_value(values, index):
    kind, function = KINDS[got(c_int, "value_kind", values, index)]
    value = got(kind, function, values, index)
    print(got(c_char_p, "value_name", values, index), "=", f"{value:g}" if kind is c_double else value)


def main():
    disk = sys.argv[1].encode() if len(sys.argv) > 1 else None
    device = got(c_void_p, "open", None)
    disks = got(c_void_p, "list_disks", device)
    for index in range(library.tallystorage_disk_count(disks)):
        name, kind = (got(c_char_p, f"disk_{field}", disks, index) for field in ("name", "kind"))
        says = got(c_uint32, "disk_flags", disks, index) & HAS_FIGURES
        print(f"disk {name}: {kind}{', says how worn it is' if says else ''}")
    health = got(c_void_p, "nand_health", device, disk)
    for index in range(library.tallystorage_value_count(health)):
        print_value(health, index)
    info = got(c_void_p, "nand_info", device, disk)
    print_value(info, got(c_size_t, "find", info, b"vellum.NANDInfo.ExportVersion"))
    library.tallystorage_free_values(info)
    library.tallystorage_free_values(health)
    library.tallystorage_free_disks(disks)
    library.tallystorage_close(device)


try:
    main()
except OSError as error:
    sys.exit(str(error))
