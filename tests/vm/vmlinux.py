"""vmlinux.py BZIMAGE VMLINUX: unpacks a kernel, which takes an emulator longer than all of its boot."""
import lzma
import pathlib
import struct
import sys

image = pathlib.Path(sys.argv[1]).read_bytes()
offset, length = struct.unpack_from("<II", image, 0x248)  # of the payload, after the setup sectors
payload = image[(image[0x1f1] + 1) * 512 + offset:][:length]
pathlib.Path(sys.argv[2]).write_bytes(lzma.LZMADecompressor().decompress(payload))
