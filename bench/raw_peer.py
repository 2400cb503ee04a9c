"""A peer that speaks the bus's wire format itself, so that it can send without waiting."""
import os
import socket
import struct

from bus import NAME, OBJECT


def _align(data, size):
    return data + b"\0" * (-len(data) % size)


def _text(value):
    return struct.pack("<I", len(value)) + value.encode() + b"\0"


def int64_fields(**fields):
    """The body of an a{sv} message of 64-bit integers."""
    body = b""
    for key, value in fields.items():
        body = _align(body, 8)
        body = _align(body + _text(key) + b"\1x\0", 8) + struct.pack("<q", value)
    return struct.pack("<I", len(body)) + b"\0\0\0\0" + body


class RawPeer:
    NO_REPLY = 1

    def __init__(self, bus):
        self.serial = 0
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.connect(str(bus.folder / "socket"))
        self.socket.sendall(b"\0AUTH EXTERNAL " + str(os.getuid()).encode().hex().encode() + b"\r\n")
        assert self.socket.recv(200).startswith(b"OK")
        self.socket.sendall(b"BEGIN\r\n")
        bus_name = "org.freedesktop.DBus"
        self.socket.sendall(self.call(bus_name, "/org/freedesktop/DBus", bus_name, "Hello", "", b""))
        assert self.socket.recv(4096)

    def call(self, destination, path, interface, member, signature, body, flags=0):
        self.serial += 1
        fields = b""
        for code, kind, value in ((1, "o", path), (2, "s", interface), (3, "s", member),
                                  (6, "s", destination)):
            fields = _align(fields, 8) + bytes([code, 1]) + kind.encode() + b"\0" + _text(value)
        if signature:
            fields = _align(fields, 8) + b"\x08\1g\0" + bytes([len(signature)]) + \
                signature.encode() + b"\0"
        head = struct.pack("<cBBBIII", b"l", 1, flags, 1, len(body), self.serial, len(fields))
        return _align(head + fields, 8) + body

    def send(self, body, flags=NO_REPLY, signature="a{sv}"):
        self.socket.sendall(self.call(NAME, OBJECT, NAME, "Send", signature, body, flags))
        return self.socket

    def wait_for_answers(self, count):
        """Reads until so many replies have arrived, and ignores their content."""
        self.socket.settimeout(120)
        seen = 0
        buffer = b""
        while seen < count:
            buffer += self.socket.recv(1 << 16)
            while len(buffer) >= 16:
                body, _, fields = struct.unpack_from("<III", buffer, 4)
                size = 16 + fields + (-fields % 8) + body
                if len(buffer) < size:
                    break
                seen += buffer[1] in (2, 3)
                buffer = buffer[size:]
