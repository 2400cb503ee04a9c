"""What a log says, and how the kernel says it."""
MIB = 1 << 20


# The bounds of a figure, from before to after the moment when it was taken.
def in_run(run):
    return lambda figure: sorted(figure(f"{moment} {run}") for moment in ("before", "after"))


AT_REPORT, AT_SWEEP = in_run(3), in_run(2)  # the third run reports the sweep of the second


def SINCE_LAST_SWEEP(figure):
    return [figure("before 2") - figure("after 1"), figure("after 2") - figure("before 1")]


def statfs(snapshot, field):
    size, *blocks = map(int, snapshot["statfs"][0].split())
    return blocks[field] * size // MIB


def meminfo(snapshot, label):
    return next(int(line.split()[1]) * 1024 for line in snapshot["/proc/meminfo"] if line.startswith(label))


def disk(snapshot, field):
    """A field of the block device's statistics as the kernel numbers them, sectors in KiB."""
    value = int(snapshot["/sys/block/nvme0n1/stat"][0].split()[field])
    return value // 2 if field in (2, 6, 13) else value


def pressure(snapshot, resource, kind):
    line = next(line for line in snapshot[f"/proc/pressure/{resource}"] if line.startswith(kind))
    return int(line.rpartition("total=")[2])


def channel(name, figure, *fields):
    return "vellum.hwreport." + name, SINCE_LAST_SWEEP, lambda snapshot: figure(snapshot, *fields)


# The log's key, its bounds, and how a snapshot says it.
FIGURES = [
    ("vellum.dockyard.DiskUsageUserTotalBlocks", AT_SWEEP, lambda snapshot: statfs(snapshot, 0)),
    ("vellum.dockyard.DiskUsageUserBlocksFree", AT_SWEEP, lambda snapshot: statfs(snapshot, 1)),
    ("vellum.usage.cur_boot_session_cpu_uptime", AT_REPORT,
     lambda snapshot: int(float(snapshot["/proc/uptime"][0].split()[0]) // 60)),
    ("vellum.kernel.swapusage", AT_REPORT, lambda snapshot: meminfo(snapshot, "SwapTotal:")),
    *(channel(f"disk0.{name}", disk, field) for name, field in
      [("reads", 0), ("read", 2), ("writes", 4), ("written", 6), ("busy", 9), ("discarded", 13), ("flushes", 15)]),
    *(channel(f"pressure.{resource}.{kind}", pressure, resource, kind) for resource, kind in
      [("cpu", "some"), ("memory", "some"), ("memory", "full"), ("io", "some"), ("io", "full")]),
]
# The files that the machine prints before and after each run.
FILES = ["/proc/uptime", "/proc/meminfo", "/sys/block/nvme0n1/stat", "/proc/pressure/cpu", "/proc/pressure/memory",
         "/proc/pressure/io"]


def read_snapshots(answers):
    """By "before" or "after" and the run's number: the lines of each file."""
    snapshots = {}
    for word, _, rest in (answer.partition(" ") for answer in answers):
        if word == "snapshot":
            current = snapshots.setdefault(rest, {})
        elif word == "figure":
            file, _, line = rest.partition(" ")
            current.setdefault(file, []).append(line.removeprefix("| "))
    return snapshots


def compare(log, answers):
    """Lines that show each figure and its bounds, and those that are outside."""
    snapshots, shown, wrong = read_snapshots(answers), [], []
    for key, bounds, figure in FIGURES:
        low, high = bounds(lambda moment: figure(snapshots[moment]))
        value = log.get(key)
        shown.append(f"{key}: {value}; the kernel says {low} to {high}")
        if value is None or not low <= value <= high:
            wrong.append(shown[-1])
    return shown, wrong
