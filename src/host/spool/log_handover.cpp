#include "host/spool/log_handover.h"

#include <fmt/core.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "base/files/file_lock.h"
#include "base/files/temporary_file.h"
#include "host/spool/waiting_logs.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kJournalFile = ".handover.plist";
constexpr std::size_t kLargestJournal = 1u << 16;
constexpr std::string_view kMarkBegin = ".handover-";
constexpr std::size_t kLongestDirectory = 4096;
// No log is larger; a file that says so has holes.
constexpr std::uint64_t kLargestLog = 256u << 20;
// Of a log that may have been held back meanwhile.
constexpr std::string_view kSuffixes[] = {"", kHeldSuffix};

std::string informationOf(std::string_view stem) {
  return std::string(stem).append(kInformationSuffix);
}
std::string_view stemOfLog(const SpooledLog& log) {
  return std::string_view(log.fileName).substr(0, log.fileName.size() - kBodySuffix.size());
}
std::string bodyOf(std::string_view stem) { return std::string(stem).append(kBodySuffix); }

// A whole new file, on the disk except for its name.
Status writeDurably(const Directory& folder, const std::string& name, std::string_view bytes,
                    unsigned mode) {
  const auto file = folder.create(name, mode);
  if (!file) return file.error();
  while (!bytes.empty()) {
    const auto count = retried([&] { return ::write(file->get(), bytes.data(), bytes.size()); });
    if (count < 0) return systemError("cannot write", folder.pathOf(name));
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  // The directory decides who reads it, not the caller's mask.
  if (::fchmod(file->get(), mode) != 0 || retried([&] { return ::fsync(file->get()); }) != 0) {
    return systemError("cannot write", folder.pathOf(name));
  }
  return Done{};
}

// Of a sorted list, which unlike a look at the file never mistakes a failing disk for a missing
// file.
bool contains(const std::vector<std::string>& names, const std::string& name) {
  return std::ranges::binary_search(names, name);
}

Status removeLog(const Directory& spool, const std::string& stem) {
  for (const std::string& name : {bodyOf(stem), informationOf(stem)}) {
    for (const std::string_view suffix : kSuffixes) {
      if (auto removed = spool.remove(name + std::string(suffix)); !removed) return removed;
    }
  }
  return spool.sync();
}

bool isSame(const Directory& one, const Directory& other) {
  const auto first = one.identity("."), second = other.identity(".");
  return first && second && first->device == second->device && first->inode == second->inode;
}

}  // namespace

// What a call is doing. Its names in the directory are its own, by a random mark.
struct LogHandover::Journal {
  std::string directory, mark;
  // Of the log whose copies are complete; an empty stem: of none yet.
  std::string stem, newStem;
  std::int64_t inode = 0, modified = 0;
  bool hasInformation = false;

  // Present as long as the journal is. Without it the directory is not the one that was written
  // to, or has been emptied, and what is missing there proves nothing.
  std::string marker() const { return mark + ".tmp~marker"; }
  std::string temporaryBody() const { return mark + ".tmp~log"; }
  std::string temporaryInformation() const { return mark + ".tmp~info"; }

  // Whether the log is still in the spool, perhaps held back: a later one may have its name.
  Result<bool> isIn(const Directory& spool) const {
    const auto names = spool.list();
    if (!names) return names.error();
    for (const std::string_view suffix : kSuffixes) {
      const std::string name = bodyOf(stem).append(suffix);
      if (stem.empty() || !contains(*names, name)) continue;
      const auto found = spool.identity(name);
      if (!found) return Error{spool.pathOf(name) + " cannot be examined"};
      if (static_cast<std::int64_t>(found->inode) == inode &&
          found->modifiedNanoseconds == modified) {
        return true;
      }
    }
    return false;
  }

  Result<std::string> encode() const {
    return encodeXmlPlist(*KvDictionary::create({{"Directory", KvString::create(directory)},
                                                 {"Mark", KvString::create(mark)},
                                                 {"Log", KvString::create(stem)},
                                                 {"NewName", KvString::create(newStem)},
                                                 {"Inode", KvNumber::int64(inode)},
                                                 {"Modified", KvNumber::int64(modified)},
                                                 {"Information", KvBoolean::of(hasInformation)}}));
  }
  // Whether a later call would find the same directory by it.
  bool canBeRead() const {
    const auto bytes = encode();
    const auto read = bytes ? parse(*bytes) : std::nullopt;
    return read && read->directory == directory;
  }

  Status write(const Directory& spool) const {
    const auto bytes = encode();
    if (!bytes) return bytes.error();
    return writeFileAtomically(spool, kJournalFile, *bytes);
  }

  static std::optional<Journal> parse(std::string_view bytes) {
    const auto root = decodePlist(bytes);
    const auto* const fields = root ? kvCast<KvDictionary>(root->get()) : nullptr;
    if (fields == nullptr) return std::nullopt;
    const auto text = [&](std::string_view key) {
      return std::string(fields->getString(key).value_or(""));
    };
    Journal journal{text("Directory"),
                    text("Mark"),
                    text("Log"),
                    text("NewName"),
                    fields->getInt64("Inode").value_or(0),
                    fields->getInt64("Modified").value_or(0),
                    fields->getBool("Information").value_or(false)};
    for (const std::string* name : {&journal.mark, &journal.stem, &journal.newStem}) {
      if (!name->empty() && !isSafeFileName(*name)) return std::nullopt;
    }
    // Names that a call can have chosen: whoever owns the spool could have written the journal.
    if (!journal.directory.starts_with('/') || journal.directory.size() > kLongestDirectory ||
        (journal.directory + "/").find("/../") != std::string::npos ||
        !journal.mark.starts_with(kMarkBegin) ||
        !isDevicePseudonym(std::string_view(journal.mark).substr(kMarkBegin.size())) ||
        (!journal.newStem.empty() && !sequenceOf(journal.newStem))) {
      return std::nullopt;
    }
    return journal;
  }
};

// What the files of a log hold; a log may be without information (ENOENT).
struct LogHandover::Copy {
  Result<std::string> body, information;
};

struct LogHandover::Target {
  Directory directory;
  unsigned mode = 0600;
  std::uint64_t nextNumber = 1;
  // Of the folder that the hooks empty; other directories have no bounds.
  bool isBounded = false;
  std::uint64_t logs = 0, bytes = 0;
};

// Before anything else is done: what an earlier call has left.
Status LogHandover::recover(const Directory& spool) const {
  const auto bytes = spool.readFile(kJournalFile, kLargestJournal);
  if (!bytes && bytes.error().systemError == ENOENT) return Done{};
  if (!bytes && mayBeSound(bytes.error())) return bytes.error();
  const auto journal = bytes ? Journal::parse(*bytes) : std::nullopt;
  if (!journal) {
    log_.fault("hand-over: journal", "{} is damaged: the logs of the spool are handed over again",
               spool.pathOf(kJournalFile));
  } else {
    const auto to = DeviceRoot("").open(journal->directory);
    if (to) {
      if (auto settled = settle(spool, *to, *journal); !settled) return settled;
    } else if (const auto isWaiting = journal->isIn(spool); !isWaiting) {
      return isWaiting.error();
    } else if (to.error().systemError != ENOENT && *isWaiting) {
      return Error{"an earlier hand-over must be completed first: " + to.error().message,
                   to.error().systemError};
    } else if (to.error().systemError != ENOENT) {
      log_.fault("hand-over: left", "hidden files of an earlier hand-over may be left: {}",
                 to.error().message);
    } else if (*isWaiting) {
      log_.fault("hand-over: unknown", "{}: {} is gone, so the log is handed over again",
                 bodyOf(journal->stem), journal->directory);
    }
  }
  if (auto removed = spool.remove(kJournalFile); !removed) return removed;
  return spool.sync();
}

Status LogHandover::settle(const Directory& spool, const Directory& to,
                           const Journal& journal) const {
  const auto isWaiting = journal.isIn(spool);
  if (!isWaiting) return isWaiting.error();
  const auto names = to.list();
  if (!names) return names.error();
  if (*isWaiting && contains(*names, journal.temporaryBody())) {
    // Not renamed, so it stays in the spool. Its information may have been.
    if (journal.hasInformation && contains(*names, journal.marker()) &&
        !contains(*names, journal.temporaryInformation())) {
      if (auto removed = to.remove(informationOf(journal.newStem)); !removed) return removed;
    }
    // Decided for good: whoever is ended from here on must not leave a journal that, without the
    // copy, would mean the opposite.
    Journal without = journal;
    without.stem.clear();
    if (auto written = without.write(spool); !written) return written;
  } else if (*isWaiting && contains(*names, journal.marker())) {
    if (auto synced = to.sync(); !synced) return synced;
    if (auto removed = removeLog(spool, journal.stem); !removed) return removed;
  } else if (*isWaiting) {
    log_.fault("hand-over: unknown", "{}: {} has been emptied, so the log is handed over again",
               bodyOf(journal.stem), to.path());
  }
  // The marker was there first, and goes last.
  if (!contains(*names, journal.marker())) return Done{};
  for (const std::string& name :
       {journal.temporaryBody(), journal.temporaryInformation(), journal.marker()}) {
    if (auto removed = to.remove(name); !removed) return removed;
  }
  return to.sync();
}

Result<LogHandover::Target> LogHandover::open(const Directory* spool, const std::string& to) const {
  // One that is not there yet is for the daily run to make, as its own user.
  if (const std::string own = spoolFolder(root_).text(); spool == nullptr && to == own) {
    return Error{own + " is the spool itself"};
  }
  const std::size_t slash = to.find_last_of('/');
  auto directory = DeviceRoot("").open(to);
  if (!directory && directory.error().systemError == ENOENT && slash != to.npos) {
    const auto parent = DeviceRoot("").open(to.substr(0, slash));
    if (!parent) return parent.error();
    directory = parent->makeDirectory(to.substr(slash + 1), 0700);
  }
  if (!directory) return directory.error();
  if (spool != nullptr && isSame(*directory, *spool)) {
    return Error{directory->path() + " is the spool itself"};
  }
  struct stat status {};
  if (::fstat(directory->descriptor(), &status) != 0) {
    return systemError("cannot examine", directory->path());
  }
  const auto present = listSequenced(*directory);
  if (!present) return present.error();
  const auto next = nextSequence(*present);
  if (!next) return Error{directory->path() + ": " + next.error().message};
  const auto outgoing = kOutgoingLogs.on(root_).open();
  Target target{*std::move(directory), (status.st_mode & S_ISGID) != 0 ? 0640u : 0600u, *next};
  target.isBounded = outgoing && isSame(*outgoing, target.directory);
  target.logs = present->size();
  for (const SequencedLog& log : *present) target.bytes += log.bytes;
  return target;
}

Result<TakenLogs> LogHandover::take(const std::string& to,
                                    const std::optional<std::string>& typeCode) {
  TakenLogs taken;
  const auto spool = spoolFolder(root_).open();
  const bool isMissing = !spool && spool.error().systemError == ENOENT;
  if (!spool && !isMissing) return spool.error();
  std::optional<Result<FileLock>> lock;
  if (!isMissing) {
    lock = FileLock::acquire(*spool, kSubmittedLogs.lock);
    if (!*lock) return lock->error();
    if (auto recovered = recover(*spool); !recovered) return recovered.error();
  }
  if (!consent_()) return Error{"submission is not allowed on this device"};
  auto target = open(isMissing ? nullptr : &*spool, to);
  if (!target) return target.error();
  if (isMissing) return taken;
  auto logs = listSpooled(*spool);
  if (!logs) return logs.error();
  std::erase_if(*logs,
                [&](const SpooledLog& log) { return typeCode && log.typeCode != *typeCode; });
  if (logs->empty()) return taken;
  // The numbers of logs that leave must be known without them.
  if (const auto identity = IdentityFile(root_).load(*spool, log_); !identity) {
    return identity.error();
  }
  const auto random = randomHex();
  if (!random) return random.error();
  Journal journal{to, std::string(kMarkBegin) + *random, {}, {}, 0, 0, false};
  if (!journal.canBeRead()) return Error{"--to: the journal cannot hold this path"};
  const Status moved = moveAll(*spool, *logs, *target, journal, taken);
  // The last log's removal, and that of the marks, is what a later call would do.
  const Status settled = recover(*spool);
  for (const Status* status : {&moved, &settled}) {
    if (!*status) taken.faults.push_back(status->error().message);
  }
  return taken;
}

Status LogHandover::moveAll(const Directory& spool, const std::vector<SpooledLog>& logs,
                            Target& target, Journal& journal, TakenLogs& taken) const {
  if (auto written = journal.write(spool); !written) return written;
  if (auto made = target.directory.writeNew(journal.marker(), "", 0600); !made) return made;
  for (const SpooledLog& log : logs) {
    if (!consent_()) return Error{"submission is no longer allowed on this device"};
    if (target.isBounded && target.logs > 0 &&
        (target.logs >= bounds_.maximumLogs || target.bytes + log.bytes > bounds_.maximumBytes)) {
      return Error{target.directory.path() + " is full"};
    }
    const Copy copy{
        spool.readFile(log.fileName, static_cast<std::size_t>(std::min(log.bytes, kLargestLog))),
        spool.readFile(informationOf(stemOfLog(log)), kLargestInformation)};
    const bool isAlone = !copy.information && copy.information.error().systemError == ENOENT;
    if (!copy.body || (!copy.information && !isAlone)) {
      taken.faults.push_back((copy.body ? copy.information : copy.body).error().message);
      continue;
    }
    if (auto moved = moveOne(spool, log, copy, target, journal); !moved) return moved;
    taken.names.push_back(bodyOf(journal.newStem));
    taken.bytes += copy.body->size();
    target.logs += 1;
    target.bytes += copy.body->size() + (isAlone ? 0 : copy.information->size());
  }
  return Done{};
}

Status LogHandover::moveOne(const Directory& spool, const SpooledLog& log, const Copy& copy,
                            Target& target, Journal& journal) const {
  const Directory& to = target.directory;
  const auto identity = spool.identity(log.fileName);
  if (!identity) return Error{spool.pathOf(log.fileName) + " is gone"};
  const auto& [body, information] = copy;
  if (auto reserve = checkReserve(to, body->size() + kLargestInformation); !reserve) return reserve;
  if (information) {
    if (auto written = writeDurably(to, journal.temporaryInformation(), *information, target.mode);
        !written) {
      return written;
    }
  }
  if (auto written = writeDurably(to, journal.temporaryBody(), *body, target.mode); !written) {
    return written;
  }
  if (auto synced = to.sync(); !synced) return synced;

  if (target.nextNumber > kLastSequence)
    return Error{to.path() + ": the logs' numbers are used up"};
  journal.stem = stemOfLog(log);
  journal.newStem = sequencePrefix(target.nextNumber++) +
                    journal.stem.substr(sequencePrefix(log.sequence).size());
  journal.inode = static_cast<std::int64_t>(identity->inode);
  journal.modified = identity->modifiedNanoseconds;
  journal.hasInformation = static_cast<bool>(information);
  if (auto written = journal.write(spool); !written) return written;
  if (information) {
    if (auto renamed =
            to.renameToNew(journal.temporaryInformation(), informationOf(journal.newStem));
        !renamed) {
      return renamed;
    }
  }
  if (auto renamed = to.renameToNew(journal.temporaryBody(), bodyOf(journal.newStem)); !renamed) {
    return renamed;
  }
  if (auto synced = to.sync(); !synced) return synced;
  return removeLog(spool, journal.stem);
}

}  // namespace tally
