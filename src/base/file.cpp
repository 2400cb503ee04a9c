// File helpers over POSIX calls; every descriptor is closed on exec.
#include "base/file.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <utility>

#include "base/retried.h"

namespace tally {
namespace {

constexpr std::string_view kTemporaryMark = ".tmp~";

Error systemError(std::string_view what, const std::string& path, int code = errno) {
  return {std::string(what) + " " + path + ": " + std::strerror(code), code};
}

Error tooLarge(const std::string& path, std::size_t limit) {
  return {path + " is larger than " + std::to_string(limit) + " bytes", EFBIG};
}

class Descriptor {
 public:
  explicit Descriptor(int value) : value_(value) {}
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  ~Descriptor() {
    if (value_ >= 0) ::close(value_);
  }
  int get() const { return value_; }

 private:
  int value_;
};

std::string folderOf(const std::string& path) {
  const auto slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

}  // namespace

// By the descriptor, since the folder's owner may have put something else at the path by now.
void giveToOwnerOfFolder(int descriptor, const std::string& path) {
  struct stat folder {
  }, made{};
  if (::geteuid() != 0 || ::stat(folderOf(path).c_str(), &folder) != 0 || folder.st_uid == 0)
    return;
  // A second name of some other file of root's, laid where a lock was expected, is not given away.
  if (::fstat(descriptor, &made) != 0 || (S_ISREG(made.st_mode) && made.st_nlink != 1)) return;
  // A volume without owners is no reason to write nothing.
  if (::fchown(descriptor, folder.st_uid, folder.st_gid) != 0) return;
}

Result<std::string> readFile(const std::string& path, std::size_t limit) {
  constexpr std::size_t kPiece = 128u << 10;
  constexpr std::size_t kSmallestPiece = 4096;  // files of the kernel say that they are empty
  // Non-blocking, so that a pipe put in a file's place cannot hold the run up.
  Descriptor file(retried([&] { return ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK); }));
  if (file.get() < 0) return systemError("cannot open", path);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return systemError("cannot examine", path);
  if (!S_ISREG(status.st_mode)) return Error{path + " is not a regular file"};
  if (static_cast<std::uint64_t>(status.st_size) > limit) return tooLarge(path, limit);
  // Through a buffer that stays in the cache, so that the contents are written to memory once.
  std::string contents;
  contents.reserve(static_cast<std::size_t>(status.st_size));
  std::vector<char> piece(
      std::clamp(static_cast<std::size_t>(status.st_size) + 1, kSmallestPiece, kPiece));
  for (;;) {
    const auto count = retried([&] { return ::read(file.get(), piece.data(), piece.size()); });
    if (count < 0) return systemError("cannot read", path);
    if (count == 0) return contents;
    contents.append(piece.data(), static_cast<std::size_t>(count));
    if (contents.size() > limit) return tooLarge(path, limit);
  }
}

Status writeFileAtomically(const std::string& path, std::string_view contents, unsigned mode) {
  if (auto made = makeFolders(folderOf(path)); !made) return made;
  auto file = TemporaryFile::beside(path, mode);
  if (!file) return file.error();
  if (auto written = file->write(contents); !written) return written;
  return file->commit();
}

std::optional<std::uint64_t> fileSize(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return std::nullopt;
  return static_cast<std::uint64_t>(status.st_size);
}

std::optional<FileIdentity> fileIdentity(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return std::nullopt;
  return FileIdentity{status.st_dev, status.st_ino, static_cast<std::uint64_t>(status.st_size),
                      std::int64_t{status.st_mtim.tv_sec} * 1'000'000'000 + status.st_mtim.tv_nsec};
}

Result<std::vector<std::string>> listFolder(const std::string& path) {
  std::vector<std::string> names;
  std::unique_ptr<DIR, int (*)(DIR*)> folder(::opendir(path.c_str()), ::closedir);
  if (!folder) {
    if (errno == ENOENT) return names;
    return systemError("cannot list", path);
  }
  for (;;) {
    errno = 0;
    const dirent* entry = ::readdir(folder.get());
    if (entry == nullptr) {
      if (errno != 0) return systemError("cannot list", path);
      break;
    }
    std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
  }
  std::sort(names.begin(), names.end());
  return names;
}

Status makeFolders(const std::string& path, unsigned mode) {
  if (::mkdir(path.c_str(), mode) == 0) {
    const Descriptor made(retried(
        [&] { return ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC); }));
    if (made.get() >= 0) giveToOwnerOfFolder(made.get(), path);
    return Done{};
  }
  if (errno == EEXIST) return Done{};
  if (errno != ENOENT) return systemError("cannot make folder", path);
  const std::string parent = folderOf(path);
  if (parent == path) return systemError("cannot make folder", path);
  if (auto made = makeFolders(parent, mode); !made) return made;
  return makeFolders(path, mode);
}

Status removeFile(const std::string& path) {
  if (::unlink(path.c_str()) == 0 || errno == ENOENT) return Done{};
  return systemError("cannot remove", path);
}

Status renameFile(const std::string& from, const std::string& to) {
  if (std::rename(from.c_str(), to.c_str()) == 0) return Done{};
  return systemError("cannot rename", from);
}

Status syncFolder(const std::string& path) {
  Descriptor folder(
      retried([&] { return ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC); }));
  if (folder.get() < 0 || retried([&] { return ::fsync(folder.get()); }) != 0) {
    return systemError("cannot sync folder", path);
  }
  return Done{};
}

std::optional<std::uint64_t> freeSpace(const std::string& path) {
  struct statvfs status {};
  if (::statvfs(path.c_str(), &status) != 0) return std::nullopt;
  return std::uint64_t{status.f_bavail} * status.f_frsize;
}

Result<TemporaryFile> TemporaryFile::beside(const std::string& path, unsigned mode) {
  static std::atomic<unsigned> counter{0};
  std::string temporary = path + std::string(kTemporaryMark) + std::to_string(::getpid()) + "." +
                          std::to_string(counter.fetch_add(1));
  const auto open = [&] {
    return ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, mode);
  };
  int descriptor = retried(open);
  if (descriptor < 0 && errno == EEXIST) {
    // Left by a killed run that had the same process number.
    ::unlink(temporary.c_str());
    descriptor = retried(open);
  }
  if (descriptor < 0) return systemError("cannot create", temporary);
  giveToOwnerOfFolder(descriptor, path);
  return TemporaryFile(path, std::move(temporary), descriptor);
}

TemporaryFile::TemporaryFile(TemporaryFile&& other) noexcept
    : path_(std::move(other.path_)),
      temporary_(std::exchange(other.temporary_, {})),
      descriptor_(std::exchange(other.descriptor_, -1)) {}

TemporaryFile::~TemporaryFile() {
  if (descriptor_ >= 0) ::close(descriptor_);
  if (!temporary_.empty()) ::unlink(temporary_.c_str());
}

Status TemporaryFile::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const auto count = retried([&] { return ::write(descriptor_, bytes.data(), bytes.size()); });
    if (count < 0) return systemError("cannot write", temporary_);
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return Done{};
}

Status TemporaryFile::commit() {
  if (retried([&] { return ::fsync(descriptor_); }) != 0) {
    return systemError("cannot sync", temporary_);
  }
  if (::close(std::exchange(descriptor_, -1)) != 0) return systemError("cannot close", temporary_);
  if (std::rename(temporary_.c_str(), path_.c_str()) != 0) {
    return systemError("cannot rename", temporary_);
  }
  temporary_.clear();
  return syncFolder(folderOf(path_));
}

bool isTemporaryName(std::string_view name) {
  return name.find(kTemporaryMark) != std::string_view::npos;
}

Result<FileLock> FileLock::acquire(const std::string& path) {
  if (auto made = makeFolders(folderOf(path)); !made) return made.error();
  const int descriptor = retried(
      [&] { return ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600); });
  if (descriptor < 0) return systemError("cannot open lock", path);
  FileLock lock(descriptor);
  giveToOwnerOfFolder(descriptor, path);
  if (retried([&] { return ::flock(descriptor, LOCK_EX); }) != 0) {
    return systemError("cannot lock", path);
  }
  return lock;
}

FileLock::FileLock(FileLock&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}

FileLock& FileLock::operator=(FileLock&& other) noexcept {
  std::swap(descriptor_, other.descriptor_);
  return *this;
}

FileLock::~FileLock() {
  if (descriptor_ >= 0) ::close(descriptor_);
}

bool isSafeFileName(std::string_view name) {
  constexpr std::size_t kLongestName = 200;
  return !name.empty() && name != "." && name != ".." && name.size() <= kLongestName &&
         name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

}  // namespace tally
