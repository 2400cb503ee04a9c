#include "platform/linux/structured_data.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>

#include "base/file.h"
#include "base/number_text.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kPendingSuffix = ".pending";
constexpr std::string_view kFinishedSuffix = ".plist";
constexpr std::string_view kLockName = "/.structured-data.lock";
// A pending log is written out before it grows beyond this.
constexpr std::size_t kLargestPending = 4u << 20;
// A record is its length in ten digits, a newline, its property list and a newline.
constexpr std::size_t kLengthDigits = 10;
constexpr std::size_t kFrameBytes = kLengthDigits + 2;
constexpr int kGenerationsKept = 7;

// The property list of the record at an offset; empty when what is there is no whole record.
std::optional<std::string_view> recordAt(std::string_view bytes, std::size_t offset) {
  const std::string_view rest = bytes.substr(offset);
  if (rest.size() < kFrameBytes || rest[kLengthDigits] != '\n') return std::nullopt;
  const auto length = parseInt64(rest.substr(0, kLengthDigits));
  if (!length || *length < 0) return std::nullopt;
  const auto size = static_cast<std::size_t>(*length);
  if (size > rest.size() - kFrameBytes || rest[kLengthDigits + 1 + size] != '\n') {
    return std::nullopt;
  }
  return rest.substr(kLengthDigits + 1, size);
}

std::string stemOf(std::string_view pendingName) {
  return std::string(pendingName.substr(0, pendingName.size() - kPendingSuffix.size()));
}

std::string finishedPath(const std::string& folder, std::string_view pendingName) {
  return folder + "/" + stemOf(pendingName) + std::string(kFinishedSuffix);
}

bool isRegularFile(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

// Moves generations up to the first free place, so that a run killed in between loses none. What is
// there is known from the folder's names, since a file that cannot be examined is no free place.
Status rollLog(const std::string& folder, const std::vector<std::string>& names,
               const std::string& name) {
  const auto generation = [&name](int number) { return fmt::format("{}.{}", name, number); };
  const auto move = [&folder](const std::string& from, const std::string& to) {
    return renameFile(folder + "/" + from, folder + "/" + to);
  };
  int free = 1;
  while (free < kGenerationsKept &&
         std::binary_search(names.begin(), names.end(), generation(free))) {
    ++free;
  }
  for (int number = free; number > 1; --number) {
    if (auto moved = move(generation(number - 1), generation(number)); !moved) return moved;
  }
  return move(name, generation(1));
}

}  // namespace

std::size_t wholeRecords(std::string_view bytes) {
  std::size_t end = 0;
  while (const auto record = recordAt(bytes, end)) end += record->size() + kFrameBytes;
  return end;
}

Status StructuredDataFolder::append(std::uint32_t recordType, const KvDictionary& record,
                                    const FolderBounds& bounds) {
  const auto text = encodeXmlPlist(record);
  if (!text) return text.error();
  const std::string frame = fmt::format("{:0{}}\n{}\n", text->size(), kLengthDigits, *text);
  if (frame.size() > kLargestPending) return Error{"the record is larger than a log may be"};
  if (auto made = makePrivateFolder(folder_); !made) return made;
  const auto lock = FileLock::acquire(folder_ + std::string(kLockName));
  if (!lock) return lock.error();
  if (auto reserve = checkReserve(folder_, frame.size()); !reserve) return reserve;
  Pending& pending = appended_[recordType];
  if (!takesMore(pending, frame.size())) {
    auto found = pendingFor(recordType, frame.size(), bounds);
    if (!found) return found.error();
    pending = *std::move(found);
  }
  auto appended = appendAt(folder_ + "/" + pending.name, pending.end, frame);
  if (appended) pending.end += frame.size();
  return appended;
}

// True when a pending log is still as this process left it, so that it need not be read again for
// every record.
bool StructuredDataFolder::takesMore(const Pending& pending, std::size_t bytes) const {
  return pending.end > 0 && pending.end + bytes <= kLargestPending &&
         fileSize(folder_ + "/" + pending.name) == pending.end &&
         !fileIdentity(finishedPath(folder_, pending.name));
}

// The pending log that takes the next record of a type. One that is full, or that a killed run had
// written out already, makes way for a new one.
Result<StructuredDataFolder::Pending> StructuredDataFolder::pendingFor(std::uint32_t recordType,
                                                                       std::size_t bytes,
                                                                       const FolderBounds& bounds) {
  const auto logs = listSequenced(folder_);
  if (!logs) return logs.error();
  const auto next = nextSequence(*logs);
  if (!next) return next.error();
  for (const SequencedLog& log : *logs) {
    const std::string name =
        fmt::format("{}{}{}", sequencePrefix(log.sequence), recordType, kPendingSuffix);
    if (!std::binary_search(log.names.begin(), log.names.end(), name)) continue;
    const bool finished = log.names.size() > 1;
    if (!finished && log.bytes + bytes <= kLargestPending) {
      const auto records = readFile(folder_ + "/" + name, kLargestPending);
      if (!records) return records.error();
      return Pending{name, wholeRecords(*records)};
    }
    if (auto done = finish(name, bounds); !done) return done.error();
  }
  return Pending{fmt::format("{}{}{}", sequencePrefix(*next), recordType, kPendingSuffix), 0};
}

void StructuredDataFolder::finishAll(const FolderBounds& bounds,
                                     const std::function<void(const Error&)>& report) {
  if (!fileIdentity(folder_)) return;  // nothing was ever logged
  const auto lock = FileLock::acquire(folder_ + std::string(kLockName));
  if (!lock) return report(lock.error());
  const auto names = listFolder(folder_);
  if (!names) return report(names.error());
  for (const std::string& name : *names) {
    if (isTemporaryName(name)) {
      (void)removeFile(folder_ + "/" + name);
    } else if (sequenceOf(name) && name.ends_with(kPendingSuffix)) {
      if (const auto done = finish(name, bounds); !done) report(done.error());
    }
  }
}

Status StructuredDataFolder::finish(const std::string& pendingName, const FolderBounds& bounds) {
  const std::string pending = folder_ + "/" + pendingName;
  const std::string finished = finishedPath(folder_, pendingName);
  if (fileIdentity(finished)) return removeFile(pending);
  const auto bytes = readFile(pending, kLargestPending);
  if (!bytes) return bytes.error();
  const auto records = KvArray::create();
  std::size_t dropped = 0;
  for (std::size_t offset = 0; offset < bytes->size();) {
    const auto record = recordAt(*bytes, offset);
    if (!record) break;
    if (const auto value = decodePlist(*record)) {
      records->append(*value);
    } else {
      ++dropped;
    }
    offset += record->size() + kFrameBytes;
  }
  const std::uint64_t sequence = *sequenceOf(pendingName);
  if (!records->empty()) {
    const auto type = parseInt64(stemOf(pendingName).substr(sequencePrefix(sequence).size()));
    const auto document = encodeXmlPlist(
        *KvDictionary::create({{"RecordType", KvNumber::int64(type.value_or(0))},
                               {"CreationTime", KvDate::create(clock_.secondsSince1970())},
                               {"Records", records}}));
    if (!document) return document.error();
    if (auto reserve = checkReserve(folder_, document->size()); !reserve) return reserve;
    if (auto written = writeFileAtomically(finished, *document); !written) return written;
  }
  if (auto removed = removeFile(pending); !removed) return removed;
  if (auto evicted = evictOldest(folder_, bounds, sequence); !evicted) return evicted;
  if (dropped > 0) return Error{fmt::format("{}: {} damaged records dropped", pending, dropped)};
  return Done{};
}

Status rollLogs(const std::string& folder) {
  const auto names = listFolder(folder);
  if (!names) return names.error();
  Status status = Done{};
  for (const std::string& name : *names) {
    const std::string path = folder + "/" + name;
    if (!name.ends_with(".log") || !isRegularFile(path) || fileSize(path).value_or(0) == 0) {
      continue;
    }
    if (auto rolled = rollLog(folder, *names, name); !rolled) status = rolled;
  }
  return status;
}

}  // namespace tally
