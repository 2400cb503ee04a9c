#include "base/files/directory.h"

#include <dirent.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "base/files/file.h"

namespace tally {
namespace {

bool isTrusted(uid_t user) { return user == 0 || user == ::geteuid(); }

bool writableByOthers(const struct stat& directory) {
  return !isTrusted(directory.st_uid) || (directory.st_mode & (S_IWGRP | S_IWOTH)) != 0;
}

// Opens a directory; one that may be passed through but not listed still leads to its files.
int openDirectoryAt(int parent, const char* name, int flags) {
  const auto open = [&](int access) {
    return retried(
        [&] { return ::openat(parent, name, access | flags | O_DIRECTORY | O_CLOEXEC); });
  };
  const int descriptor = open(O_RDONLY);
  return descriptor < 0 && errno == EACCES ? open(O_PATH) : descriptor;
}

bool isEmptyDirectory(int directory) {
  const int descriptor = openDirectoryAt(directory, ".", 0);
  if (descriptor < 0) return false;
  DIR* const listing = ::fdopendir(descriptor);
  if (listing == nullptr) {
    ::close(descriptor);
    return false;
  }
  int entries = 0;
  while (entries <= 2 && ::readdir(listing) != nullptr) ++entries;
  ::closedir(listing);
  return entries <= 2;
}

}  // namespace

Directory::Directory(Descriptor descriptor, std::string path, const Directory* root)
    : descriptor_(std::make_shared<Descriptor>(std::move(descriptor))), path_(std::move(path)) {
  struct stat status {};
  // One that cannot be examined belongs to nobody, so nothing is given away there.
  if (::fstat(descriptor_->get(), &status) == 0) {
    owner_ = status.st_uid;
    group_ = status.st_gid;
  }
  root_ = root != nullptr ? root->root_ : Place{status.st_dev, status.st_ino};
}

Directory::Trust Directory::trust() const {
  constexpr int kDeepest = 256;
  Trust trust;
  Descriptor above;
  int here = descriptor();
  for (int depth = 0; depth < kDeepest; ++depth) {
    struct stat status {};
    if (::fstat(here, &status) != 0) break;
    if (writableByOthers(status)) trust.exclusive = false;
    if (!trust.user && !isTrusted(status.st_uid)) trust.user = status.st_uid;
    if (Place{status.st_dev, status.st_ino} == root_) return trust;
    above = Descriptor(retried(
        [&] { return ::openat(here, "..", O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC); }));
    if (!above) break;
    here = above.get();
  }
  trust.exclusive = false;  // the way up does not lead to the root
  return trust;
}

bool Directory::exists() const {
  struct stat status {};
  return ::fstat(descriptor(), &status) == 0 && status.st_nlink > 0;
}

Result<Directory> Directory::open(const std::string& path) {
  Descriptor descriptor(openDirectoryAt(AT_FDCWD, path.c_str(), 0));
  if (!descriptor) return systemError("cannot open", path);
  return Directory(std::move(descriptor), path, nullptr);
}

std::string Directory::pathOf(std::string_view name) const {
  return path_ + (path_.ends_with('/') ? "" : "/") + std::string(name);
}

Result<Directory> Directory::openDirectory(std::string_view name) const {
  std::string path = pathOf(name);
  Descriptor opened(openDirectoryAt(descriptor(), std::string(name).c_str(), O_NOFOLLOW));
  if (opened) return Directory(std::move(opened), std::move(path), this);
  int code = errno;
  struct stat status {};
  // The kernel calls a link no directory.
  if (code == ENOTDIR &&
      ::fstatat(descriptor(), std::string(name).c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
      S_ISLNK(status.st_mode)) {
    code = ELOOP;
  }
  if (code == ELOOP) return Error{path + " is a symbolic link, which is not followed", ELOOP};
  return systemError("cannot open", path, code);
}

Result<Directory> Directory::openBelow(std::string_view path) const {
  open_how how{};
  how.flags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS;
  const std::string text(path);
  Descriptor opened(static_cast<int>(retried(
      [&] { return ::syscall(SYS_openat2, descriptor(), text.c_str(), &how, sizeof how); })));
  if (!opened) return systemError("cannot open", pathOf(path));
  return Directory(std::move(opened), pathOf(path), this);
}

// By the descriptor, since the directory's owner may have put something else at the name by now.
void Directory::giveToOwner(int made, const struct stat& status) const {
  if (::geteuid() != 0 || owner_ == 0 || status.st_uid != 0) return;
  // Some volumes have no file owners; writing continues there.
  if (::fchown(made, owner_, group_) != 0) return;
}

Result<Directory> Directory::makeDirectory(std::string_view name, unsigned mode) const {
  const std::string text(name);
  if (::mkdirat(descriptor(), text.c_str(), mode) != 0) {
    if (errno != EEXIST) return systemError("cannot make directory", pathOf(name));
    return openDirectory(name);
  }
  auto made = openDirectory(name);
  if (!made) return made;
  struct stat status {};
  // The owner of this directory can replace the new directory with another, even one that root
  // created elsewhere. So only an empty one is given away.
  if (owner_ != 0 && ::fstat(made->descriptor(), &status) == 0 &&
      isEmptyDirectory(made->descriptor())) {
    giveToOwner(made->descriptor(), status);
    made->owner_ = owner_;
    made->group_ = group_;
  }
  if (auto synced = sync(); !synced) return synced.error();
  return made;
}

Status Directory::check(int file, std::string_view name) const {
  struct stat status {};
  if (::fstat(file, &status) != 0) return systemError("cannot examine", pathOf(name));
  if (!S_ISREG(status.st_mode)) return Error{pathOf(name) + " is not a regular file"};
  const bool single = status.st_nlink == 1;
  if (single && (isTrusted(status.st_uid) || status.st_uid == owner_)) return Done{};
  const Trust here = trust();
  if (here.exclusive) return Done{};
  if (!single) {
    return Error{pathOf(name) + " has more than one name, so it may be a foreign file", EMLINK};
  }
  if (status.st_uid != here.user) {
    return Error{pathOf(name) + " belongs to user " + std::to_string(status.st_uid), EPERM};
  }
  return Done{};
}

// Non-blocking, so that a pipe or a device in a file's place cannot block the run.
Result<Descriptor> Directory::openFile(std::string_view name, int flags) const {
  Descriptor file(retried([&] {
    return ::openat(descriptor(), std::string(name).c_str(),
                    flags | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
  }));
  if (!file && errno == ELOOP) {
    return Error{pathOf(name) + " is a symbolic link, which is not followed", ELOOP};
  }
  // The errors of a pipe without a reader and of a device without a driver.
  if (!file && errno == ENXIO) return Error{pathOf(name) + " is not a regular file"};
  if (!file) return systemError("cannot open", pathOf(name));
  if (auto checked = check(file.get(), name); !checked) return checked.error();
  return file;
}

Result<std::string> Directory::readFile(std::string_view name, std::size_t limit) const {
  const auto file = openFile(name, O_RDONLY);
  if (!file) return file.error();
  return readDescriptor(file->get(), pathOf(name), limit);
}

Result<FileReader> Directory::openForReading(std::string_view name, std::size_t limit) const {
  auto file = openFile(name, O_RDONLY);
  if (!file) return file.error();
  return FileReader::start(*std::move(file), pathOf(name), limit);
}

Result<Descriptor> Directory::openForWriting(std::string_view name) const {
  return openFile(name, O_WRONLY);
}

Result<Descriptor> Directory::create(std::string_view name, unsigned mode) const {
  Descriptor file(retried([&] {
    return ::openat(descriptor(), std::string(name).c_str(),
                    O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, mode);
  }));
  if (!file) return systemError("cannot create", pathOf(name));
  struct stat status {};
  if (owner_ != 0 && ::fstat(file.get(), &status) == 0) giveToOwner(file.get(), status);
  return file;
}

Status Directory::writeNew(std::string_view name, std::string_view contents, unsigned mode) const {
  const auto file = create(name, mode);
  if (!file) return file.error();
  while (!contents.empty()) {
    const auto count =
        retried([&] { return ::write(file->get(), contents.data(), contents.size()); });
    if (count < 0) return systemError("cannot write", pathOf(name));
    contents.remove_prefix(static_cast<std::size_t>(count));
  }
  return Done{};
}

Status Directory::makeLink(const std::string& target, std::string_view name) const {
  if (::symlinkat(target.c_str(), descriptor(), std::string(name).c_str()) == 0) return Done{};
  return systemError("cannot make", pathOf(name));
}

std::optional<FileIdentity> Directory::identity(std::string_view name) const {
  struct stat status {};
  if (::fstatat(descriptor(), std::string(name).c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
    return std::nullopt;
  }
  return FileIdentity{status.st_dev, status.st_ino, static_cast<std::uint64_t>(status.st_size),
                      std::int64_t{status.st_mtim.tv_sec} * 1'000'000'000 + status.st_mtim.tv_nsec,
                      S_ISREG(status.st_mode)};
}

std::optional<std::string> Directory::trustedLink(std::string_view name) const {
  struct stat status {};
  const std::string text(name);
  if (::fstatat(descriptor(), text.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
      !S_ISLNK(status.st_mode) || !isTrusted(status.st_uid) || !trust().exclusive) {
    return std::nullopt;
  }
  char target[PATH_MAX];
  const auto length = ::readlinkat(descriptor(), text.c_str(), target, sizeof target);
  if (length <= 0 || length == sizeof target) return std::nullopt;
  return std::string(target, static_cast<std::size_t>(length));
}

Result<std::vector<std::string>> Directory::list() const {
  Descriptor listed(openDirectoryAt(descriptor(), ".", 0));
  if (!listed) return systemError("cannot list", path_);
  std::unique_ptr<DIR, int (*)(DIR*)> listing(::fdopendir(listed.get()), ::closedir);
  if (!listing) return systemError("cannot list", path_);
  listed.release();
  std::vector<std::string> names;
  for (;;) {
    errno = 0;
    const dirent* entry = ::readdir(listing.get());
    if (entry == nullptr) {
      if (errno != 0) return systemError("cannot list", path_);
      break;
    }
    std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
  }
  std::sort(names.begin(), names.end());
  return names;
}

Status Directory::remove(std::string_view name) const {
  if (::unlinkat(descriptor(), std::string(name).c_str(), 0) == 0 || errno == ENOENT) return Done{};
  return systemError("cannot remove", pathOf(name));
}

Status Directory::removeTree(std::string_view name) const {
  if (const auto directory = openDirectory(name)) {
    const auto names = directory->list();
    if (!names) return names.error();
    for (const std::string& each : *names) {
      if (auto removed = directory->removeTree(each); !removed) return removed;
    }
    const std::string text(name);
    if (::unlinkat(descriptor(), text.c_str(), AT_REMOVEDIR) == 0) return Done{};
    return systemError("cannot remove", pathOf(name));
  }
  return remove(name);
}

Status Directory::rename(std::string_view from, std::string_view to) const {
  if (::renameat(descriptor(), std::string(from).c_str(), descriptor(), std::string(to).c_str()) ==
      0) {
    return Done{};
  }
  return systemError("cannot rename", pathOf(from));
}

Status Directory::renameToNew(std::string_view from, std::string_view to) const {
  if (::renameat2(descriptor(), std::string(from).c_str(), descriptor(), std::string(to).c_str(),
                  RENAME_NOREPLACE) == 0) {
    return Done{};
  }
  if (errno != EINVAL && errno != ENOSYS) return systemError("cannot make", pathOf(to));
  if (identity(to)) return systemError("cannot make", pathOf(to), EEXIST);
  return rename(from, to);
}

Status Directory::sync() const {
  if (retried([&] { return ::fsync(descriptor()); }) != 0) {
    return systemError("cannot sync directory", path_);
  }
  return Done{};
}

Status Directory::syncVolume() const {
  if (retried([&] { return ::syncfs(descriptor()); }) != 0) {
    return systemError("cannot sync the volume of", path_);
  }
  return Done{};
}

std::optional<std::uint64_t> Directory::freeSpace() const {
  struct statvfs status {};
  if (::fstatvfs(descriptor(), &status) != 0) return std::nullopt;
  return std::uint64_t{status.f_bavail} * status.f_frsize;
}

}  // namespace tally
