#!/usr/bin/env python3
"""Recorded devices as text: one file each, from which the directory of a recording is made.

    [/sys/class/net]                       the directory of the following names, which is made
    eth0 -> ../../devices/platform/net/eth0
    ifindex = 2                            a file of one line
    uevent:                                a file of several lines, which are indented
      INTERFACE=eth0
    page # 512 5:03 32:0010                a file of so many bytes, zeros except from these offsets on
"""
import pathlib
import sys


def unpack(text, root):
    """Makes the device below the directory root."""
    folder, lines, target = root, text.splitlines(), None
    for line in lines:
        if line.startswith("  ") and target is not None:
            target.write_text(target.read_text() + line[2:] + "\n")
        elif line.startswith("["):
            folder = root / line[2:line.index("]")]
            folder.mkdir(parents=True, exist_ok=True)
        elif " -> " in line:
            name, _, to = line.partition(" -> ")
            (folder / name).symlink_to(to)
        elif " # " in line:
            name, _, size, *parts = line.split()
            page = bytearray(int(size))
            for offset, _, digits in (part.partition(":") for part in parts):
                page[int(offset):int(offset) + len(digits) // 2] = bytes.fromhex(digits)
            (folder / name).write_bytes(page)
        elif line.endswith(":"):
            target = folder / line[:-1]
            target.write_text("")
        elif line and not line.startswith(";"):
            name, _, value = line.partition(" =")
            (folder / name).write_text(value[1:] + "\n")


def pack(root):
    """The text of a recording; what is not text is left out."""
    for folder in sorted(path for path in [root, *root.rglob("*")] if path.is_dir() and not path.is_symlink()):
        members = sorted(path for path in folder.iterdir() if path.is_symlink() or path.is_file())
        if not members and any(folder.iterdir()):
            continue
        yield f"[/{folder.relative_to(root)}]"
        for path in members:
            if path.is_symlink():
                yield f"{path.name} -> {path.readlink()}"
                continue
            lines = path.read_text().splitlines()
            if len(lines) <= 1:
                yield f"{path.name} = {''.join(lines)}"
            else:
                yield "\n  ".join([f"{path.name}:", *lines])


def main():
    """device_tree.py unpack OUTPUT TREE...: each below OUTPUT. device_tree.py pack DIR: to standard output."""
    if sys.argv[1] == "pack":
        print("\n".join(pack(pathlib.Path(sys.argv[2]))))
        return
    for tree in map(pathlib.Path, sys.argv[3:]):
        unpack(tree.read_text(), pathlib.Path(sys.argv[2]) / tree.stem)


if __name__ == "__main__":
    main()
