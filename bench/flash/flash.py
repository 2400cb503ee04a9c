"""What an ordinary day and a day of recording write to the disk, counted by the emulated machine's block
layer: for some intervals between commits, and beside programs that commit each value. With --days only the
ordinary day, of former programs too if the machine was made with some. scripts/bench-flash starts it."""
import concurrent.futures
import pathlib
import plistlib
import shutil
import subprocess
import sys

TOP = pathlib.Path(__file__).resolve().parents[2]
sys.path[:0] = [str(TOP / "tests/vm"), str(TOP / "bench")]
from bench_figures import add_figure, at_most
from machine import MADE, Machine
from run import FIRST_DAY

INTERVALS, DEFAULT_INTERVAL = (1, 5, 15, 60), 15  # minutes
METRICS = 86400 * 110
SINGLE = 100  # values that the yardstick commits one by one
MIB = 1 << 20
SECTOR = 512
LONGEST_DAY = 1200  # seconds
DAYS = 12  # of which the last half is counted: the first ones make directories and files
FORMER_DAY = 806  # KiB, of the programs of schema version 1, in the same machine; at most half of it now
WHITELIST = {"Machine": {"ScalarKeys": {}, "DistributionKeys": {}, "ScalarKeyPrefixes": {"com.example.": {}},
                         "DistributionKeyPrefixes": {"com.example.": {}}}}


class FlashMachine(Machine):
    """With a disk of the common block size, whose file system has nothing left to initialise."""
    FILE_SYSTEM = ["-b", "4096", "-E", "lazy_itable_init=0,lazy_journal_init=0"]
    SIZE = "512M"

    def answers(self, **arguments):
        """By name what the machine answers: bytes written until then, or a text."""
        self.log.write_bytes(b"")
        command = self.command(FIRST_DAY, "virtio", {"DAY": FIRST_DAY, **arguments})
        said = subprocess.run(command, stdin=subprocess.DEVNULL, capture_output=True, text=True, errors="replace",
                              timeout=LONGEST_DAY, check=False).stdout.splitlines()
        if "measured" not in said:
            raise SystemExit(f"the machine failed, see {self.folder}/console: {said[-5:]}")
        return dict(line.split(" ", 1) for line in said if " " in line)


def written(answers, begin, end):
    """Bytes, write requests and flushes between two moments."""
    first, last = (list(map(int, answers[moment].split())) for moment in (begin, end))
    return [(b - a) * unit for a, b, unit in zip(first, last, (SECTOR, 1, 1))]


def make_machine(name):
    return FlashMachine(name, {
        "Library/Application Support/Tallybook/Whitelist_Nimbus.plist": WHITELIST,
        "var/mobile/Library/Preferences/vellum.tallyd.tallyrun.plist": {}}, None)


def ordinary_day():
    print("an ordinary day: 200 scalars and 32 distributions of 24 samples in one import, and the daily job")
    print(f"{'programs':<14}{'recording, KiB':>15}{'daily job, KiB':>16}{'both, KiB':>11}{'requests':>10}{'flushes':>9}")
    for name, programs in (("former", "former/bin"), ("these", "usr/bin")):
        if not (MADE / "root" / programs / "tallyrun").exists():
            continue
        answers = make_machine(f"days-{name}").answers(MODE="days", PROGRAMS=f"/{programs}", LAST=DAYS - 1)
        if answers["logs"] != str(DAYS):
            raise SystemExit(f"not every day has a log: {answers['logs']}")
        counted = range(DAYS // 2, DAYS)
        recording, job = ([sum(figure) / len(counted) for figure in zip(
            *(written(answers, f"{begin}-{day}", f"{end}-{day}") for day in counted))]
                          for begin, end in (("begun", "recorded"), ("recorded", "reported")))
        both = [a + b for a, b in zip(recording, job)]
        print(f"{name:<14}{recording[0] / 1024:15.0f}{job[0] / 1024:16.0f}{both[0] / 1024:11.0f}{both[1]:10.0f}"
              f"{both[2]:9.0f}", flush=True)
    add_figure("an ordinary day, flash written", both[0] / 1024, "KiB", at_most(FORMER_DAY / 2))


def measure(minutes):
    machine = make_machine(f"flash-{minutes}")
    answers = machine.answers(MODE="flash", MINUTES=minutes)
    (machine.folder / "answers").write_text("".join(f"{name} {text}\n" for name, text in answers.items()))
    if answers["recorded"] != f"{METRICS} of {METRICS}":
        raise SystemExit(f"not all was recorded: {answers['recorded']}")
    return answers


def main():
    ordinary_day()
    if "--days" in sys.argv:
        return
    print("\na day of 100 counts a second over 500 keys and 10 samples a second over 50 keys, MiB written")
    print(f"{'interval':<14}{'recording':>10}{'with the daily run':>20}{'requests':>10}{'flushes':>9}"
          f"{'of each commit, KiB':>21}")
    with concurrent.futures.ThreadPoolExecutor(2) as pool:  # what is counted is not time
        days = list(pool.map(measure, INTERVALS))
    for minutes, answers in zip(INTERVALS, days):
        size, requests, flushes = written(answers, "start", "day")
        whole = written(answers, "start", "report")[0]
        print(f"{minutes:3} min{size / MIB:17.1f}{whole / MIB:20.1f}{requests:10}{flushes:9}"
              f"{size / 1024 * minutes / 1440:21.1f}", flush=True)
        if minutes == DEFAULT_INTERVAL:
            default = size
    for name, end in (("tallyctl store set", "set"), ("tallyctl store push", "push")):
        size, _, flushes = written(answers, f"before-{end}", end)
        print(f"{name}, a commit for each of {SINGLE} values: {size / SINGLE / 1024:.1f} KiB and "
              f"{flushes / SINGLE:.1f} flushes each; a day would be {size / SINGLE * METRICS / MIB / 1024:,.0f} GiB")
    add_figure("a day of recording, flash written", default / MIB, "MiB", at_most(40))
    add_figure("a day of recording, beside single commits", default / MIB, "MiB",
               beside=(name, size / SINGLE * METRICS / MIB))


if __name__ == "__main__":
    main()
