#include "platform/linux/sequence_folder.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>

#include "base/file.h"
#include "base/number_text.h"
#include "base/retried.h"

namespace tally {
namespace {

constexpr std::size_t kDigits = 10;
constexpr std::uint64_t kLastSequence = 9'999'999'999;

// A volume that runs full takes a part before it says so.
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

Result<std::vector<SequencedLog>> listSequenced(const std::string& folder) {
  const auto names = listFolder(folder);
  if (!names) return names.error();
  std::vector<SequencedLog> logs;  // the sorted names bring the files of a log together
  for (const std::string& name : *names) {
    const auto sequence = sequenceOf(name);
    if (!sequence) continue;
    if (logs.empty() || logs.back().sequence != *sequence) logs.push_back({*sequence, 0, {}});
    logs.back().bytes += fileSize(folder + "/" + name).value_or(0);
    logs.back().names.push_back(name);
  }
  return logs;
}

Result<std::uint64_t> nextSequence(const std::vector<SequencedLog>& logs) {
  const std::uint64_t next = logs.empty() ? 1 : logs.back().sequence + 1;
  if (next > kLastSequence) return Error{"the logs' numbers are used up"};
  return next;
}

Status evictOldest(const std::string& folder, const FolderBounds& bounds, std::uint64_t kept) {
  const auto logs = listSequenced(folder);
  if (!logs) return logs.error();
  std::uint64_t count = logs->size(), bytes = 0;
  for (const SequencedLog& log : *logs) bytes += log.bytes;
  for (const SequencedLog& log : *logs) {
    if (count <= bounds.maximumLogs && bytes <= bounds.maximumBytes) break;
    if (log.sequence >= kept) break;  // a newer one makes its own room when it is done
    for (auto name = log.names.rbegin(); name != log.names.rend(); ++name) {
      if (auto removed = removeFile(folder + "/" + *name); !removed) return removed;
    }
    --count;
    bytes -= log.bytes;
  }
  return Done{};
}

Status checkReserve(const std::string& folder, std::uint64_t bytes) {
  const auto space = freeSpace(folder);
  if (space && *space < kReservedBytes + bytes) {
    return Error{fmt::format("{} bytes are left on the volume of {}", *space, folder)};
  }
  return Done{};
}

Status makePrivateFolder(const std::string& folder) {
  const auto slash = folder.rfind('/');
  if (slash != std::string::npos && slash > 0) {
    if (auto made = makeFolders(folder.substr(0, slash)); !made) return made;
  }
  return makeFolders(folder, 0700);
}

Status appendAt(const std::string& path, std::size_t end, std::string_view bytes) {
  const auto failure = [&path] {
    return Error{fmt::format("cannot append to {}: {}", path, std::strerror(errno)), errno};
  };
  const int file = retried(
      [&] { return ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600); });
  if (file < 0) return failure();
  giveToOwnerOfFolder(file, path);
  Status status = Done{};
  const auto start = static_cast<off_t>(end);
  const auto cutBack = [&] { return retried([&] { return ::ftruncate(file, start); }) == 0; };
  if (!cutBack() || !writeAllAt(file, bytes, start) ||
      retried([&] { return ::fdatasync(file); }) != 0) {
    status = failure();
    (void)cutBack();
  }
  ::close(file);
  return status;
}

}  // namespace tally
