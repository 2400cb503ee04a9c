// Everything that the programs hold about a device and its user: one row each. docs/privacy.md
// shows this table, and a test fails when a folder or a table of the store has no row.
#pragma once

#include <string_view>

namespace tally {

struct HeldDatum {
  std::string_view what;
  std::string_view where;  // names of tables and paths are in ``
  std::string_view purpose;
  std::string_view retention;
  std::string_view readers;
  std::string_view erasure;
};

inline constexpr std::string_view kErasedByForget = "`tallyctl forget`";
inline constexpr std::string_view kErasedWithConsent =
    "`tallyctl forget`; withdrawing consent, unless `WithdrawnLogs` is `hold`";
inline constexpr std::string_view kStoreReaders = "`mobile`, root";
inline constexpr std::string_view kStoreRetention = "the latest 30 days that hold data";

inline constexpr HeldDatum kHeldData[] = {
    {"metrics that have just been sent", "memory of `tallyd`",
     "fewer writes: commits once every `CommitInterval`",
     "15 minutes by default; until the daily run asks", "`mobile`, root",
     "`tallyctl forget`; a commit moves them to the store"},
    {"metrics that a program has not sent yet", "memory of a program that uses `libtallyclient`",
     "sending them together", "until they are sent or dropped", "that program", "ending it"},
    {"users, keys and rates of who records", "memory of `tallyd`", "limits, and whose a key is",
     "until midnight UTC, or until it ends", "`mobile`, root (`tallyctl recorder`)",
     "`systemctl stop tallyd.service`"},
    {"the keys that were refused last, with day, reason and number", "memory of `tallyd`",
     "why a metric is not in the log", "the latest 64 names; until it ends",
     "`mobile`, root (`tallyctl recorder`)", kErasedByForget},
    {"scalars by day and key", "store, `scalars`", "the daily log", kStoreRetention, kStoreReaders,
     kErasedByForget},
    {"samples with their second of the day",
     "store, `arrivals` and `series`; of an older schema also `chunks`, `recent` and `packed`",
     "statistics and histograms of the daily log", kStoreRetention, kStoreReaders, kErasedByForget},
    {"user number of who recorded a key first on a day", "store, `owners`",
     "nobody changes another user's figures", kStoreRetention, kStoreReaders, kErasedByForget},
    {"metrics recorded before the clock was set, with the boot's identifier", "store, `undated`",
     "giving them their day later",
     "until the clock is set, or another boot shows that it never was", kStoreReaders,
     kErasedByForget},
    {"last value of each of the kernel's counters, and its sum", "store, `counters`",
     "the amount of a day", "as long as the counter is read; 65,536 at most", kStoreReaders,
     kErasedByForget},
    {"the job's own figures (clock, boots, suspension), with the boot's UUID", "store, `counters`",
     "how far a day's log can be trusted in time",
     "as long as the whitelist admits them, then "
     "the latest 30 days that hold data; the UUID: until a run of the next boot",
     kStoreReaders, kErasedByForget},
    {"wear of each disk, under the disk's identifier, and bytes written", "store, `wear`",
     "the forecast of the storage's life", "4,096 rows for each disk (decades)", kStoreReaders,
     kErasedByForget},
    {"the store's journal", "beside the store, `-wal`, `-shm`, `-journal`", "durable commits",
     "until the next checkpoint", kStoreReaders, kErasedByForget},
    {"stores of a newer version of the program, after a rollback", "beside the store, `.newer-N`",
     "nothing is lost: the newer program reads them again", "until they are removed", kStoreReaders,
     kErasedByForget},
    {"daily and storage logs, with name, time, version, pseudonym and number",
     "`/var/mobile/Library/Logs/Submission`", "waiting for an uploader",
     "until they are taken; `SpoolMaximumLogs`, `SpoolMaximumBytes`", "`mobile`, root",
     kErasedWithConsent},
    {"where logs are being moved to, and which", "`.handover.plist` in the spool",
     "each log leaves once", "while `tallyctl report take` works, or until it works again",
     "`mobile`, root", "the next `tallyctl report take`"},
    {"logs for the hooks", "`/var/spool/tallyrun`", "waiting for the hooks",
     "until every hook has taken them; `SpoolMaximumLogs`, `SpoolMaximumBytes`",
     "`mobile`, root, the user `tallyrun-upload`", kErasedWithConsent},
    {"logs moved elsewhere, and `.handover-*`, copies of those being moved",
     "the directory that `tallyctl report take --to` named, if not `/var/spool/tallyrun`",
     "waiting for an uploader of the administrator's",
     "until they are taken; the copies: while `tallyctl report take` works, or until it works "
     "again",
     "whom that directory lets read it: its owner, and its group if it is set-group-ID",
     "removing them: `tallyctl forget` does not reach them"},
    {"what hooks get: a log's path, name, type, pseudonym and number",
     "arguments and environment of the hooks of `/etc/tallyrun.d/submitted`", "uploading",
     "while a hook runs; what it sends is no longer the device's",
     "the hooks, and the administrator who installs them", "the collector: docs/fleet.md"},
    {"pseudonym (random), and the last number of each kind of log",
     "`/var/mobile/Library/Tallybook/SubmissionIdentity.plist`",
     "a collector can tell devices apart and see that a log was lost", "until it is reset",
     "`mobile`, root; whoever gets a log",
     "`tallyctl report pseudonym --reset`, `tallyctl forget`; withdrawing consent, unless "
     "`WithdrawnLogs` is `hold`"},
    {"structured data of the storage", "`/var/mobile/Library/Logs/StructuredData`",
     "waiting for an uploader", "until they are taken; `SpoolMaximumLogs`, `SpoolMaximumBytes`",
     "`mobile`, root", kErasedWithConsent},
    {"analytics events", "`/var/mobile/Library/Logs/AnalyticsEvents`", "waiting for an uploader",
     "until they are taken; `SpoolMaximumLogs`, `SpoolMaximumBytes`", "`mobile`, root",
     kErasedWithConsent},
    {"logs of the repair service, which that service writes", "`/var/mobile/Library/Logs/Fixline`",
     "diagnosis; the daily run only renames them", "seven generations", "`mobile`, root",
     "removing them"},
    {"settings and the history of the programs (table below)",
     "`/var/mobile/Library/Preferences`, `/Library/Preferences`", "see below",
     "until they are changed or removed", "their owner, root",
     "`tallyctl prefs delete`; the history: `tallyctl forget`"},
    {"health pages of NVMe disks", "`/run/tallyd/nvme-health-*`", "the wear of the disk",
     "until the next boot", "everybody", "`systemctl stop` of the units, and removing them"},
    {"lines of the programs: what they did, keys and paths of what is at fault",
     "the system's journal", "diagnosis", "as the journal keeps it",
     "root, and the groups that may read the journal", "`journalctl --vacuum-time=`"},
    {"pages of a device's metrics, rules and logs", "the files of `tallyctl report page -o`",
     "showing their owner what is recorded and what leaves", "until they are removed",
     "the user who ran it", "removing them"},
    {"rows of an OpenMetrics export that is being sorted",
     "files without names in the system's directory for temporary files", "exporting many logs",
     "while `tallyctl report export` runs", "that program", "ending it"},
    {"recordings of what the kernel shows, with serial numbers and addresses only by `--raw`",
     "the directory that `tallyctl device record` named", "reproducing a fault elsewhere",
     "until they are removed", "everybody whom the directory above lets reach it", "removing them"},
    {"what a collector has: logs, exported rows, Parquet files, tables of ClickHouse",
     "the collector's machines and its backups", "questions about the fleet",
     "as the collector decides", "whom the collector lets read it",
     "`node fleet/tallyfleet.mjs forget`, by the pseudonym: docs/fleet.md"},
    {"a driver's figures, and the last sample of a program",
     "memory of a program that uses `libhwreport` or `libtallystorage`",
     "differences of two samples", "while the program holds them", "that program", "ending it"},
    {"locks, which are empty", "`*.lock` in the folders above", "programs wait for each other",
     "for ever", "`mobile`, root", "removing them while no program runs"},
};

}  // namespace tally
