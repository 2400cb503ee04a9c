"""What scripts/bench runs, in the order of docs/performance.md. A new benchmark is an entry here; it prints a
text and calls addFigure (bench/figures.h) or add_figure (bench/bench_figures.py) for each row of the table."""
import collections

from performance import plots

# name: the program, below scripts or build/bin, and its arguments. what: is measured, with which yardstick.
# draw: makes its picture of its text, plots.NAME(path, lines).
# when_named: runs only when it is named, since it takes as long as all others and a machine's speed does not
# change what it counts.
Benchmark = collections.namedtuple("Benchmark", "name title what picture draw when_named", defaults=(None, None, False))

BENCHMARKS = [
    Benchmark("bench_daily_log", "The daily log of a large day",
              "`tallyrun -f` on a store of 100,000 scalar keys and 1,000 distributions of 10,000 samples, half of them with "
              "20 boundaries. Yardsticks: one SQL query for count, minimum, maximum and mean of each key over a table with "
              "a row for each sample, and a Python script that makes the same log from that table. For the pass over the "
              "samples alone: reading the same store without computing anything. Each sample waits for the division of the "
              "one before, because the mean is a recurrence whose bits are fixed; samples of eight keys are therefore "
              "summarised side by side."),
    Benchmark("bench_daily_log growth", "How the daily log grows",
              "The same with fewer and more samples and the same 100,000 scalars.",
              "performance-daily-log.svg", plots.daily_log),
    Benchmark("bench_ordinary_day", "The daily log of an ordinary day",
              "`tallyrun -f` on a store of 200 scalars and 32 distributions of 840 samples. Yardstick: an empty C++ "
              "program. The least of 30 runs."),
    Benchmark("bench_import", "Importing a day",
              "`tallyctl store import` of the same ten million samples from CSV. Yardstick: Python's csv and sqlite3."),
    Benchmark("bench_export", "Exporting logs",
              "`tallyctl report export` of a spool of 1,000 logs. Yardstick: a Python script that makes the same rows with "
              "plistlib and json."),
    Benchmark("bench_store_size", "What a day takes in the store",
              "Bytes for each sample of the whole store file, and the CPU time of reading all values, process included. "
              "Yardsticks: a store of schema version 1, which has the samples as they are; and zstd at level 1 on the raw "
              "columns of each key, without a store around them, as they are and with their bytes shuffled, whose time is "
              "that of decompressing the values alone."),
    Benchmark("bench_whitelist", "Reading a whitelist",
              "A whitelist of one group is read from its file into the tables of the daily job. Yardstick: Python's "
              "plistlib loads the same file."),
    Benchmark("bench_startup", "Starting for nothing",
              "`tallyrun -d` on a day that is already processed. Yardsticks: an empty C++ program, and the same program "
              "without the module that only a run with something to do loads, for both `-d` and `-f`."),
    Benchmark("count-instructions", "Instructions of an ordinary day",
              "The instructions that an x86-64 processor executes for the sample device's day, without the kernel's work: "
              "the same on a machine of any speed and load. The time on a core is the number of instructions divided by the "
              "product of its clock rate and its instructions per cycle. A core of 500 MHz that completes one instruction "
              "every second cycle executes 250 million a second, and takes 0.15 s for the first row. A 32-bit ARM executes "
              "a fifth more: 45.1 million for the first row, counted in the emulator on 2026-11-25. The emulation of Debian "
              "12's valgrind lacks a system call, openat2, in whose place the program opens directories one by one: with "
              "it, the first and the last row are 2 % less."),
    Benchmark("bench_hwreport", "Statistics channels",
              "1,000, 10,000 and 100,000 channels of mixed formats whose runs are in shuffled order, in nanoseconds per "
              "channel. Yardsticks: a plain copy of the same memory, and a scan of the whole buffer for every channel.",
              "performance-sampling.svg", plots.channels),
    Benchmark("bench_storage", "Storage statistics",
              "From a full statistics buffer to the dictionary. Yardsticks: a walk that only sums the values, and the same "
              "work with linear searches of the two tables. Then a buffer of a million records."),
    Benchmark("bench_sweep", "The daily sweep",
              "The sweep on the sample device, including the store. Yardstick: a bare write of the same number of scalars "
              "in one transaction."),
    Benchmark("bench_kernel", "The kernel's statistics",
              "A sample of all channels of a large machine, from a generated tree, and of this machine; and the daily sweep "
              "of the large one. Yardsticks: loops that only read the same files, opened each time or kept open."),
    Benchmark("bench-peers channels", "The kernel's statistics beside other collectors",
              "A sample of this machine's channels. Yardsticks: two other collectors with the same sources, whose packages "
              "are unpacked in a folder of their own."),
    Benchmark("bench_client", "Recording from a program",
              "A call of libtallyclient, CPU time of the calling thread, the kernel's work included; the daemon's side is "
              "not counted. Yardstick: `sendto` of one datagram for each value."),
    Benchmark("bench_recorder", "Recording a metric",
              "What `tallyd` takes for a metric, 500 counters and 50 distributions in turn, commits included; `per` is the "
              "metrics in a datagram. Yardstick: a process that receives the same datagrams, one by one, and does nothing "
              "else. Senders wait where the socket is UNIX; UDP comes at 100,000 and 50,000 datagrams a second. The least "
              "of three runs. systemd raises the queue of UNIX sockets from 10 datagrams to 512; the benchmark sets it in a "
              "network namespace of its own."),
    Benchmark("bench-peers recording", "Recording beside other daemons",
              "The same datagrams over UDP, at rates that each daemon bears; the kernel counts what is lost. The other "
              "daemons flush nothing meanwhile: npm's `statsd` 0.9 has no backend, Debian's `collectd` its statsd plugin "
              "alone."),
    Benchmark("bench_recorder_loss", "Metrics that are lost",
              "Not taken: the sender was told so, which is what `libtallyclient` counts. Lost: nobody was told. Yardstick: "
              "what a process does not take that only receives, since other programs on the machine may keep both from a "
              "processor for longer than a queue lasts; the best of three runs. Then a program that records without a "
              "pause: what it dropped is in the store."),
    Benchmark("bench_recorder_memory", "Memory of the recorder",
              "Pages that no other process shares, as the kernel counts them (`Private_Clean` and `Private_Dirty` of "
              "`smaps_rollup`), and those of them that were written. Samples that share a second are a byte smaller than "
              "others; these come within seconds. By default `tallyd` commits at half of its limit, and peaks while more "
              "samples come."),
    Benchmark("bench-flash", "What recording writes to flash",
              "A day in an emulated machine whose clock is set forward in steps of two seconds; sectors written are counted "
              "at its block layer: ext4 with blocks of 4 KiB, synced after each commit. The default is 15 minutes: an hour "
              "would write a third and lose four times as much in a crash, 5 minutes write twice as much. Yardstick: values "
              "that are committed one by one.", when_named=True),
    Benchmark("bench-page", "The owner's page of a large day",
              "Opening `tallyctl report page` of a day of 100,000 keys in headless Chromium, from the start of the "
              "navigation to the first frame with rows; the least of three openings. Yardstick: a plain table of the same "
              "keys and values."),
    Benchmark("bench-fleet questions", "Questions about a fleet",
              "2,000 devices × 30 logs of 60 keys; the best of three runs. DuckDB reads the Parquet files that `tallyfleet "
              "convert` made."),
    Benchmark("bench-fleet loading", "Loading a fleet's logs",
              "The same logs into a ClickHouse server. Yardstick: the server's own client reads the same files into a plain "
              "table; it looks for no logs and keeps repeated rows."),
    Benchmark("bench_snapshot", "Snapshots as text",
              "100,000 snapshot records as text. Yardstick: the same lines made with `snprintf`."),
    Benchmark("bench_events", "Analytics events",
              "The 35 payloads built from one dictionary. Yardsticks: a copy of the dictionary, and a linear search for "
              "each field."),
    Benchmark("bench_plist", "Property lists",
              "Writing a large log and reading a large whitelist. Yardstick: the installed property-list library."),
]
