"""An emulated machine whose disk loses, when it is switched off, whatever was not flushed."""
import datetime
import json
import math
import pathlib
import plistlib
import shutil
import struct
import subprocess
import threading

TOP = pathlib.Path(__file__).resolve().parents[2]
MADE = TOP / "build/vm"
EPOCH = datetime.date(1970, 1, 1)
SECTOR = 512
FLUSH, DURABLE, DISCARD = 1, 2, 4  # flags of an entry of the disk's log
# The emulated NVMe does not tell the disk of writes that must be durable at once, with which the file
# system ends its transactions; the other has flushes instead. Where nothing is lost, sleep takes no time.
DISKS = {"NVMe": ("nvme,serial=emulated", "nvme0n1", ["-icount", "shift=3,sleep=off"]),
         "virtio": ("virtio-blk-pci", "vda", [])}
LONGEST_BOOT = 120  # seconds, on a machine that has other things to do


class Machine:
    FILE_SYSTEM = []  # further options of mke2fs
    SIZE = "64M"

    def __init__(self, name, volume, chance):
        """volume: the property lists of the data volume, by path; chance: decides what the disk loses."""
        self.folder, self.chance = MADE / name, chance
        shutil.rmtree(self.folder, ignore_errors=True)
        self.disk, self.before, self.log = (self.folder / part for part in ("disk", "disk-before", "disk-log"))
        for path, content in volume.items():
            target = self.folder / "volume" / path
            target.parent.mkdir(parents=True, exist_ok=True)
            target.write_bytes(plistlib.dumps(content))
        subprocess.run(["mke2fs", "-q", "-t", "ext4", *self.FILE_SYSTEM, "-d", self.folder / "volume", self.disk, self.SIZE],
                       check=True, capture_output=True)

    def boot(self, day, sign, disk, lives=LONGEST_BOOT, **arguments):
        """Starts the machine at noon of a day, and switches it off so many seconds after it has given the
        sign if it is not off by then. Its answers, each with the length of the disk's log at the time."""
        shutil.copyfile(self.disk, self.before)
        self.log.write_bytes(b"")
        answers = []
        with subprocess.Popen(self.command(day, disk, arguments), stdin=subprocess.DEVNULL,
                              stdout=subprocess.PIPE, text=True, errors="replace") as emulator:
            timers = [threading.Timer(seconds, emulator.kill) for seconds in (LONGEST_BOOT, lives)]
            timers[0].start()
            for line in emulator.stdout:
                if line.endswith("\n"):  # else it was cut off
                    answers.append((self.log.stat().st_size, line.strip()))
                    if line.strip() == sign:
                        timers[1].start()
            for timer in timers:
                timer.cancel()
        if emulator.returncode == 0:
            answers.append((self.log.stat().st_size, "off by itself"))
        if sign not in (text for _, text in answers):
            raise SystemExit(f"the machine failed, see {self.folder}/console: {answers[-5:]}")
        return answers

    def lose(self, end=math.inf):
        """Makes the disk what it is if the machine is switched off when the disk's log is so long: the former
        disk, what was written until the last flush, and of later writes none, some or most."""
        entries = [entry for entry in read_disk_log(self.log) if entry[0] <= end]
        flushed = max((number for number, entry in enumerate(entries) if entry[1] & FLUSH), default=-1)
        share = self.chance.choice((0, 0.5, 0.9))
        shutil.copyfile(self.before, self.disk)
        with open(self.disk, "r+b") as disk:
            for number, (_, flags, offset, data) in enumerate(entries):
                if number <= flushed or flags & DURABLE or self.chance.random() < share:
                    disk.seek(offset)
                    disk.write(data)

    def moments(self, count):
        """Some lengths that the disk's log had."""
        return sorted(self.chance.choices([end for end, *_ in read_disk_log(self.log)], k=count))

    def command(self, day, disk, arguments):
        device, name, options = DISKS[disk]
        file = {"driver": "file", "cache": {"no-flush": True}}  # this machine stays on
        words = {"DISK": name, "VOLUME_OPTIONS": "defaults", **arguments}
        return [
            "qemu-system-x86_64", "-machine", "pc", "-accel", "tcg", "-m", "256", "-nodefaults", "-no-user-config",
            "-nic", "none", "-display", "none", "-no-reboot", *options,
            "-rtc", f"base={EPOCH + datetime.timedelta(day)}T12:00:00",
            "-serial", f"file:{self.folder}/console", "-serial", "stdio",
            "-blockdev", json.dumps({"driver": "blklogwrites", "node-name": "disk",
                                     "file": {**file, "filename": str(self.disk)},
                                     "log": {**file, "filename": str(self.log)}}),
            "-device", f"{device},drive=disk", "-kernel", MADE / "vmlinux", "-initrd", MADE / "initramfs",
            "-append", " ".join(["console=ttyS0 quiet panic=-1 rdinit=/bin/init",
                                 *(f"{name}={word}" for name, word in words.items())])]

    def files(self):
        """A copy of the data volume, after what a kernel would do at the next boot."""
        copy, tree = self.folder / "copy", self.folder / "tree"
        shutil.copyfile(self.disk, copy)
        shutil.rmtree(tree, ignore_errors=True)
        tree.mkdir()
        subprocess.run(["e2fsck", "-p", copy], capture_output=True)  # the journal
        subprocess.run(["debugfs", "-R", f"rdump / {tree}", copy], capture_output=True, check=True)
        return tree


def read_disk_log(path):
    """End, flags, offset and data of each entry: a sector of its own, then what was written. The first sector
    is of the log itself; what was being written when the emulator was killed may be missing."""
    content = path.read_bytes()
    at = SECTOR
    while at + SECTOR <= len(content):
        sector, sectors, flags = struct.unpack_from("<QQQ", content, at)
        at += SECTOR
        data = content[at:at + (0 if flags & DISCARD else sectors * SECTOR)]
        at += len(data)
        yield at, flags, sector * SECTOR, data
