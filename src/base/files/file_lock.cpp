#include "base/files/file_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <thread>

#include "base/text_lines.h"

namespace tally {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr std::size_t kLargestLockTable = 4u << 20;

// The text after `position` up to the next blank, and position after it.
std::string_view nextWord(std::string_view line, std::size_t& position) {
  const std::size_t begin = std::min(line.find_first_not_of(' ', position), line.size());
  const std::size_t end = std::min(line.find(' ', begin), line.size());
  position = end;
  return line.substr(begin, end - begin);
}

template <class Number>
bool parseWhole(std::string_view text, Number& number, int base) {
  const auto [end, code] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  return code == std::errc{} && end == text.data() + text.size();
}

// "08:02:1234": major and minor number of the device in hexadecimal, the file's number in decimal.
bool isFile(std::string_view word, std::uint64_t device, std::uint64_t inode) {
  const std::size_t first = word.find(':'), second = word.rfind(':');
  unsigned majorNumber = 0, minorNumber = 0;
  std::uint64_t number = 0;
  return second != first && parseWhole(word.substr(0, first), majorNumber, 16) &&
         parseWhole(word.substr(first + 1, second - first - 1), minorNumber, 16) &&
         parseWhole(word.substr(second + 1), number, 10) && number == inode &&
         makedev(majorNumber, minorNumber) == static_cast<dev_t>(device);
}

std::string holderText(int file) {
  struct stat status {};
  const auto locks = readFile("/proc/locks", kLargestLockTable);
  if (locks && ::fstat(file, &status) == 0) {
    if (const auto holder = lockHolder(*locks, status.st_dev, status.st_ino)) {
      return "process " + std::to_string(*holder);
    }
  }
  return "another process";
}

Status waitFor(int file, milliseconds patience, const std::string& path) {
  constexpr milliseconds kLongestPause{20};
  const auto end = steady_clock::now() + patience;
  milliseconds pause{1};
  while (retried([&] { return ::flock(file, LOCK_EX | LOCK_NB); }) != 0) {
    if (errno != EWOULDBLOCK) {
      return Error{"cannot lock " + path + ": " + std::strerror(errno), errno};
    }
    if (steady_clock::now() >= end) {
      return Error{path + " is locked by " + holderText(file), EWOULDBLOCK};
    }
    std::this_thread::sleep_for(pause);
    pause = std::min(pause * 2, kLongestPause);
  }
  return Done{};
}

// An existing lock file is opened for writing, since some file systems lock no other.
Result<Descriptor> openLock(const Directory& directory, std::string_view name) {
  constexpr unsigned kMode = 0600;
  constexpr int kAttempts = 8;  // others make and remove it at the same time
  for (int attempt = 1;; ++attempt) {
    auto file = directory.openForWriting(name);
    if (file || file.error().systemError != ENOENT || attempt == kAttempts) return file;
    file = directory.create(name, kMode);
    if (file || file.error().systemError != EEXIST) return file;
  }
}

}  // namespace

Result<FileLock> FileLock::acquire(const Directory& directory, std::string_view name,
                                   milliseconds patience) {
  auto file = openLock(directory, name);
  if (!file) return file.error();
  if (auto locked = waitFor(file->get(), patience, directory.pathOf(name)); !locked) {
    return locked.error();
  }
  return FileLock(*std::move(file));
}

Result<FileLock> FileLock::acquire(const Directory& directory, std::string_view name) {
  static std::atomic<milliseconds> left{std::chrono::minutes(1)};
  const auto start = steady_clock::now();
  auto lock = acquire(directory, name, left.load());
  const auto waited = std::chrono::duration_cast<milliseconds>(steady_clock::now() - start);
  left = std::max(left.load() - waited, milliseconds(0));
  return lock;
}

std::optional<std::int64_t> lockHolder(std::string_view locks, std::uint64_t device,
                                       std::uint64_t inode) {
  // "1: FLOCK  ADVISORY  WRITE 713 08:02:1234 0 EOF"; those that wait have an arrow before the
  // kind.
  while (!locks.empty()) {
    const std::string_view line = takeLine(locks);
    std::size_t position = 0;
    (void)nextWord(line, position);
    if (nextWord(line, position) != "FLOCK") continue;
    (void)nextWord(line, position);
    (void)nextWord(line, position);
    std::int64_t process = 0;
    if (!parseWhole(nextWord(line, position), process, 10) || process <= 0) continue;
    if (isFile(nextWord(line, position), device, inode)) return process;
  }
  return std::nullopt;
}

}  // namespace tally
