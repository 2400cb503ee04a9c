"""Records one metric of each kind through the C library (TALLYCLIENT_SOCKET, or the device's own socket)."""
import ctypes
import os
import sys

library = ctypes.CDLL("libtallyclient.so.0")
library.tallyclient_open.argtypes = [ctypes.c_char_p]
library.tallyclient_open.restype = ctypes.c_void_p
library.tallyclient_set.argtypes = [ctypes.c_void_p, ctypes.c_char_p, ctypes.c_int64]
library.tallyclient_add.argtypes = [ctypes.c_void_p, ctypes.c_char_p, ctypes.c_int64]
library.tallyclient_push.argtypes = [ctypes.c_void_p, ctypes.c_char_p, ctypes.c_double]
library.tallyclient_push_many.argtypes = [
    ctypes.c_void_p, ctypes.c_char_p, ctypes.POINTER(ctypes.c_double), ctypes.c_size_t]
library.tallyclient_close.argtypes = [ctypes.c_void_p]

metrics = library.tallyclient_open(None)
waits = (ctypes.c_double * 3)(12.5, 0.75, 3)
library.tallyclient_set(metrics, b"com.example.pump.temperature", -4)
library.tallyclient_add(metrics, b"com.example.pump.starts", 1)
library.tallyclient_push(metrics, b"com.example.pump.pressure", 1.8)
library.tallyclient_push_many(metrics, b"com.example.pump.wait", waits, len(waits))
fault = library.tallyclient_close(metrics)
if fault:
    sys.exit(f"not recorded: {os.strerror(fault)}")
