#include "host/spool/sequence_folder.h"

#include <fmt/core.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>

#include "base/files/file.h"
#include "base/files/temporary_file.h"
#include "base/number_text.h"

namespace tally {
namespace {

constexpr std::size_t kDigits = 10;
// A log a second for thirty years.
constexpr std::uint64_t kLastReachable = 999'999'999;
// Logs after a stray file with a nearly unreachable number have such numbers too. They are set
// aside with it; otherwise each later log would continue from it again.
constexpr std::uint64_t kStrayMargin = 1'000'000;
constexpr std::string_view kAsidePrefix = "set-aside-";

// A volume that becomes full accepts part of a write before it reports the error.
bool writeAllAt(int file, std::string_view bytes, off_t offset) {
  while (!bytes.empty()) {
    const auto count = retried([&] { return ::pwrite(file, bytes.data(), bytes.size(), offset); });
    if (count < 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
    offset += count;
  }
  return true;
}

}  // namespace

std::optional<std::uint64_t> sequenceOf(std::string_view name) {
  if (name.size() <= kDigits || name[kDigits] != '-' || isTemporaryName(name)) return std::nullopt;
  const auto number = parseInt64(name.substr(0, kDigits));
  if (!number || *number < 0) return std::nullopt;
  return static_cast<std::uint64_t>(*number);
}

std::string sequencePrefix(std::uint64_t sequence) { return fmt::format("{:010}-", sequence); }

Result<std::vector<SequencedLog>> listSequenced(const Directory& folder) {
  const auto names = folder.list();
  if (!names) return names.error();
  std::vector<SequencedLog> logs;  // the sorted names bring the files of a log together
  for (const std::string& name : *names) {
    const auto sequence = sequenceOf(name);
    if (!sequence) continue;
    if (logs.empty() || logs.back().sequence != *sequence) logs.push_back({*sequence, 0, {}});
    const auto identity = folder.identity(name);
    logs.back().bytes += identity ? identity->size : 0;
    logs.back().names.push_back(name);
  }
  return logs;
}

Result<std::vector<SequencedLog>> listForWriting(const Directory& folder, SystemLog& log) {
  auto logs = listSequenced(folder);
  if (!logs || logs->empty() || logs->back().sequence <= kLastReachable) return logs;
  while (!logs->empty() && logs->back().sequence > kLastReachable - kStrayMargin) {
    for (const std::string& name : logs->back().names) {
      const auto renamed = folder.rename(name, std::string(kAsidePrefix) + name);
      // One that keeps its name is ignored all the same.
      log.fault("log set aside", "{}: set aside, since no log can have this number{}",
                folder.pathOf(name), renamed ? "" : "; " + renamed.error().message);
    }
    logs->pop_back();
  }
  return logs;
}

Result<std::uint64_t> nextSequence(const std::vector<SequencedLog>& logs) {
  const std::uint64_t next = logs.empty() ? 1 : logs.back().sequence + 1;
  if (next > kLastSequence) return Error{"the logs' numbers are used up"};
  return next;
}

Status evictOldest(const Directory& folder, const FolderBounds& bounds, std::uint64_t kept) {
  const auto logs = listSequenced(folder);
  if (!logs) return logs.error();
  std::uint64_t count = logs->size(), bytes = 0;
  for (const SequencedLog& log : *logs) bytes += log.bytes;
  Status status = Done{};
  for (const SequencedLog& log : *logs) {
    if (count <= bounds.maximumLogs && bytes <= bounds.maximumBytes) break;
    if (log.sequence >= kept) break;  // a newer one frees its own space when it is finished
    for (auto name = log.names.rbegin(); name != log.names.rend(); ++name) {
      if (auto removed = folder.remove(*name); !removed) {
        status = removed;
        break;
      }
    }
    // An entry that cannot be removed, such as a folder, must not protect the others.
    --count;
    bytes -= log.bytes;
  }
  return status;
}

Status checkReserve(const Directory& folder, std::uint64_t bytes) {
  const auto space = folder.freeSpace();
  if (space && *space < kReservedBytes + bytes) {
    return Error{fmt::format("{} bytes are left on the volume of {}", *space, folder.path()),
                 ENOSPC};
  }
  return Done{};
}

Result<Directory> makePrivateFolder(const DeviceDirectory& folder) { return folder.make(0700); }

Status appendAt(const Directory& folder, std::string_view name, std::size_t end,
                std::string_view bytes) {
  auto file = folder.openForWriting(name);
  const bool isNew = !file && file.error().systemError == ENOENT;
  if (isNew) file = folder.create(name, 0600);
  if (!file) return file.error();
  const auto start = static_cast<off_t>(end);
  const auto cutBack = [&] {
    return retried([&] { return ::ftruncate(file->get(), start); }) == 0;
  };
  const auto sync = [&] { return retried([&] { return ::fdatasync(file->get()); }) == 0; };
  // What is cut off is off the disk before anything takes its place: a power cut could leave pieces
  // of both, which together might pass for a record.
  struct stat status {};
  const bool ready =
      ::fstat(file->get(), &status) == 0 && (status.st_size == start || (cutBack() && sync()));
  if (!ready || !writeAllAt(file->get(), bytes, start) || !sync()) {
    const int code = errno;
    (void)cutBack();
    return Error{fmt::format("cannot append to {}: {}", folder.pathOf(name), std::strerror(code)),
                 code};
  }
  return isNew ? folder.sync() : Done{};
}

}  // namespace tally
