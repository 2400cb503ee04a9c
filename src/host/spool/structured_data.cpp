#include "host/spool/structured_data.h"

#include <fmt/core.h>

#include <algorithm>
#include <cerrno>

#include "base/files/file_lock.h"
#include "base/files/temporary_file.h"
#include "base/number_text.h"
#include "host/spool/waiting_logs.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kPendingSuffix = ".pending";
constexpr std::string_view kFinishedSuffix = ".plist";
// A pending log is written out before it grows beyond this.
constexpr std::size_t kLargestPending = 4u << 20;
// A record is its length in ten digits, a newline, its property list and a newline.
constexpr std::size_t kLengthDigits = 10;
constexpr std::size_t kFrameBytes = kLengthDigits + 2;
constexpr int kGenerationsKept = 7;

// The property list of the record at an offset; empty if there is no whole record.
std::optional<std::string_view> recordAt(std::string_view bytes, std::size_t offset) {
  const std::string_view rest = bytes.substr(offset);
  if (rest.size() < kFrameBytes || rest[kLengthDigits] != '\n') return std::nullopt;
  const auto length = parseInt64(rest.substr(0, kLengthDigits));
  if (!length || *length < 0 || *length > std::ssize(rest) - std::ptrdiff_t{kFrameBytes}) {
    return std::nullopt;
  }
  const auto size = static_cast<std::size_t>(*length);
  if (rest[kLengthDigits + 1 + size] != '\n') return std::nullopt;
  return rest.substr(kLengthDigits + 1, size);
}

std::string stemOf(std::string_view pendingName) {
  return std::string(pendingName.substr(0, pendingName.size() - kPendingSuffix.size()));
}

std::string finishedName(std::string_view pendingName) {
  return stemOf(pendingName) + std::string(kFinishedSuffix);
}

// Moves generations up to the first free place, so that a run killed in between loses none. The
// folder's names show which places are taken, since a file that cannot be examined still takes one.
Status rollLog(const Directory& folder, const std::vector<std::string>& names,
               const std::string& name) {
  const auto generation = [&name](int number) { return fmt::format("{}.{}", name, number); };
  int free = 1;
  while (free < kGenerationsKept &&
         std::binary_search(names.begin(), names.end(), generation(free))) {
    ++free;
  }
  for (int number = free; number > 1; --number) {
    if (auto moved = folder.rename(generation(number - 1), generation(number)); !moved)
      return moved;
  }
  return folder.rename(name, generation(1));
}

}  // namespace

std::size_t wholeRecords(std::string_view bytes) {
  // No record has a zero byte. Zeros are what a power cut leaves where bytes did not arrive.
  bytes = bytes.substr(0, bytes.find('\0'));
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
  const auto folder = makePrivateFolder(folder_);
  if (!folder) return folder.error();
  const auto lock = FileLock::acquire(*folder, kStructuredDataLogs.lock);
  if (!lock) return lock.error();
  if (auto reserve = checkReserve(*folder, frame.size()); !reserve) return reserve;
  Pending& pending = appended_[recordType];
  if (!takesMore(*folder, pending, frame.size())) {
    auto found = pendingFor(*folder, recordType, frame.size(), bounds);
    if (!found) return found.error();
    pending = *std::move(found);
  }
  auto appended = appendAt(*folder, pending.name, pending.end, frame);
  if (appended) pending.end += frame.size();
  return appended;
}

// True when a pending log is still as this process left it, so that it need not be read again for
// every record.
bool StructuredDataFolder::takesMore(const Directory& folder, const Pending& pending,
                                     std::size_t bytes) {
  if (pending.end == 0 || pending.end + bytes > kLargestPending) return false;
  const auto identity = folder.identity(pending.name);
  return identity && identity->size == pending.end && !folder.identity(finishedName(pending.name));
}

// The pending log that takes the next record of a type. A new one replaces one that is full, or
// that a killed run had already written out.
Result<StructuredDataFolder::Pending> StructuredDataFolder::pendingFor(const Directory& folder,
                                                                       std::uint32_t recordType,
                                                                       std::size_t bytes,
                                                                       const FolderBounds& bounds) {
  const auto logs = listForWriting(folder, log_);
  if (!logs) return logs.error();
  const auto next = nextSequence(*logs);
  if (!next) return next.error();
  for (const SequencedLog& log : *logs) {
    const std::string name =
        fmt::format("{}{}{}", sequencePrefix(log.sequence), recordType, kPendingSuffix);
    if (!std::binary_search(log.names.begin(), log.names.end(), name)) continue;
    const bool finished = log.names.size() > 1;
    if (!finished && log.bytes + bytes <= kLargestPending) {
      const auto records = folder.readFile(name, kLargestPending);
      if (records) return Pending{name, wholeRecords(*records)};
      log_.fault(faultKind("structured data", records.error()), "structured data of type {}: {}",
                 recordType, records.error().message);
      continue;  // the record goes to another log
    }
    if (auto done = finish(folder, name, bounds); !done) return done.error();
  }
  return Pending{fmt::format("{}{}{}", sequencePrefix(*next), recordType, kPendingSuffix), 0};
}

void StructuredDataFolder::finishAll(const FolderBounds& bounds,
                                     const std::function<void(const Error&)>& report) {
  const auto folder = folder_.open();
  if (!folder && folder.error().systemError == ENOENT) return;  // nothing was ever logged
  if (!folder) return report(folder.error());
  const auto lock = FileLock::acquire(*folder, kStructuredDataLogs.lock);
  if (!lock) return report(lock.error());
  const auto names = folder->list();
  if (!names) return report(names.error());
  for (const std::string& name : *names) {
    if (isTemporaryName(name)) {
      (void)folder->remove(name);
    } else if (sequenceOf(name) && name.ends_with(kPendingSuffix)) {
      if (const auto done = finish(*folder, name, bounds); !done) report(done.error());
    }
  }
}

Status StructuredDataFolder::finish(const Directory& folder, const std::string& pendingName,
                                    const FolderBounds& bounds) {
  const std::string finished = finishedName(pendingName);
  if (folder.identity(finished)) return folder.remove(pendingName);
  const auto bytes = folder.readFile(pendingName, kLargestPending);
  if (!bytes) return bytes.error();
  const auto records = KvArray::create();
  std::size_t dropped = 0;
  const std::size_t end = wholeRecords(*bytes);
  for (std::size_t offset = 0; offset < end;) {
    const auto record = recordAt(*bytes, offset);
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
    if (auto reserve = checkReserve(folder, document->size()); !reserve) return reserve;
    if (auto written = writeFileAtomically(folder, finished, *document); !written) return written;
  }
  if (auto removed = folder.remove(pendingName); !removed) return removed;
  if (auto evicted = evictOldest(folder, bounds, sequence); !evicted) return evicted;
  if (dropped > 0)
    return Error{
        fmt::format("{}: {} damaged records dropped", folder.pathOf(pendingName), dropped)};
  return Done{};
}

Status rollLogs(const DeviceDirectory& place) {
  const auto folder = place.open();
  if (!folder && folder.error().systemError == ENOENT) return Done{};
  if (!folder) return folder.error();
  const auto names = folder->list();
  if (!names) return names.error();
  Status status = Done{};
  bool changed = false;
  for (const std::string& name : *names) {
    const auto identity = name.ends_with(".log") ? folder->identity(name) : std::nullopt;
    if (!identity || !identity->regular || identity->size == 0) continue;
    if (auto rolled = rollLog(*folder, *names, name); !rolled) status = rolled;
    changed = true;
  }
  if (changed && status) status = folder->sync();
  return status;
}

}  // namespace tally
