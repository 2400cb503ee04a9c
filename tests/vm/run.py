"""run.py [--resets N | --control] [--seed S]; --prepare ROOT writes what the machine needs to know."""
import argparse
import collections
import copy
import math
import pathlib
import plistlib
import random
import shutil

import figures
from ledger import KEPT_LOGS, TASKED, Files, Ledger
from machine import MADE, Machine

FIRST_DAY = 20514  # 2026-03-02
LONGEST_LIFE = 6  # seconds, more than all actions take
EARLIER_MOMENTS = 4  # of each life, at which its disk is checked as if the machine had been switched off
VOLUME = {
    "Library/Application Support/Tallybook/Whitelist_Nimbus.plist": {"Machine": {
        "ScalarKeys": {key: {} for key, _, _ in figures.FIGURES}, "DistributionKeys": {"vm.push": {}},
        "ScalarKeyPrefixes": {"vm.": {}}, "DistributionKeyPrefixes": {}}},
    "Library/Preferences/vm.own.plist": {},
    "var/mobile/Library/Preferences/vellum.tallyd.tallyrun.plist": {"SpoolMaximumLogs": KEPT_LOGS},
}
# Each must lose something; else the resets show nothing. The store and the events use fdatasync.
CONTROLS = {"no fsync of files": {"PRELOAD": "/no-sync.so", "UNSYNCED": "files"},
            "no fsync of directories": {"PRELOAD": "/no-sync.so", "UNSYNCED": "directories"},
            "no fdatasync": {"PRELOAD": "/no-sync.so", "UNSYNCED": "data"},
            "no flush of the disk": {"VOLUME_OPTIONS": "nobarrier"}}
CONTROL_RESETS = 20  # at most


def prepare(root):
    (root / "figures").write_text("\n".join(figures.FILES) + "\n")
    (root / "schedule.plist").write_bytes(plistlib.dumps({"ScheduledTasking": {
        "TaskingID": "NUMBER", "TaskingDigest": "NUMBER", "TaskingPayload": [
            {"User": user, "Domain": domain, "Key": key, "Value": "NUMBER"} for user, domain, key in TASKED]}}))


def live(chance):
    """Three days of an ordinary machine; what its last log says otherwise than the kernel."""
    machine = Machine("living", VOLUME, chance)
    answers = machine.boot(FIRST_DAY, "lived", "NVMe", MODE="live")
    machine.lose()
    files = Files(machine.files())
    shown, wrong = figures.compare(files.reports[-1], [text for _, text in answers])
    print(*shown, sep="\n")
    return [*wrong, *files.faults]


def told_by(answers, end):
    """What was answered by then, and what may have been begun."""
    told = [text for at, text in answers if at <= end]
    return told + [text for _, text in answers[len(told):][:1] if text.startswith("try")]


def resets(name, count, chance, **arguments):
    """For each reset: what is lost or not whole, then or if it had been earlier; how many actions were
    acknowledged; and the interrupted ones. After a fault another machine goes on."""
    machine = None
    for boot in range(count):
        if machine is None:
            machine, ledger, scheduled = Machine(name, VOLUME, chance), Ledger(), ""
        day = FIRST_DAY + boot
        answers = machine.boot(day, "ready", "virtio", MODE="act", FIRST=1000 * (boot + 1) + chance.randrange(7),
                               lives=chance.uniform(0, LONGEST_LIFE), SCHEDULED=scheduled, **arguments)
        faults, interrupted = [text for _, text in answers if text.startswith(("failed", "off"))], []
        for moment in [*machine.moments(EARLIER_MOMENTS), math.inf]:
            machine.lose(moment)
            files, now = Files(machine.files()), copy.deepcopy(ledger)
            interrupted += now.read(told_by(answers, moment), day)
            faults += now.check(files, day)
            if faults:
                shutil.copytree(machine.folder, MADE / f"{name}-fault-{boot + 1}", dirs_exist_ok=True)
                machine = None
                break
        ledger, scheduled = now, files.tasking() or ""
        acknowledged = sum(text.startswith("done") for _, text in answers)
        print(f"reset {boot + 1}: {acknowledged} acknowledged", *faults, sep="\n  ", flush=True)
        yield faults, acknowledged, interrupted


def switch_off(count, chance):
    results = list(resets("resets", count, chance))
    kinds = collections.Counter(action.kind for _, _, interrupted in results for action in interrupted)
    print(f"{count} resets, each with {EARLIER_MOMENTS} earlier moments;",
          f"{sum(number for _, number, _ in results)} actions acknowledged; interrupted:",
          ", ".join(f"{number} {kind}" for kind, number in kinds.most_common()))
    return [fault for faults, _, _ in results for fault in faults]


def control(chance):
    faults = []
    for what, arguments in CONTROLS.items():
        print(f"Control: {what}")
        if not any(lost for lost, _, _ in resets("control", CONTROL_RESETS, chance, **arguments)):
            faults.append(f"{what}, and nothing is lost")
    return faults


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--prepare", type=pathlib.Path)
    parser.add_argument("--resets", type=int, default=0)
    parser.add_argument("--control", action="store_true")
    parser.add_argument("--seed", type=int, default=random.randrange(1 << 32))
    options = parser.parse_args()
    if options.prepare:
        return prepare(options.prepare)
    print(f"seed {options.seed}")
    chance = random.Random(options.seed)
    faults = control(chance) if options.control else live(chance)
    if options.resets:
        faults += switch_off(options.resets, chance)
    raise SystemExit("\n".join(["Faults:", *faults]) if faults else 0)


if __name__ == "__main__":
    main()
