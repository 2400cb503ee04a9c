// File helpers: whole-file reads with a bound, atomic replacement, locks, folders.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"

namespace tally {

// The whole file. Refuses folders, devices and files larger than limit, without reading them.
Result<std::string> readFile(const std::string& path, std::size_t limit);

// What root makes in the folder of another user belongs to that user, who could not read it else:
// files, folders and locks alike.

// Does so for a file that was made at the path without these helpers.
void giveToOwnerOfFolder(int descriptor, const std::string& path);

// Replaces path by contents so that, whenever the process or the machine dies, the file is either
// the old one or the new one: temporary name in the same folder, write, fsync, rename, fsync of
// the folder. Missing folders are made. Nothing is left behind on failure.
Status writeFileAtomically(const std::string& path, std::string_view contents,
                           unsigned mode = 0600);

// Size in bytes of a regular file; empty when it cannot be examined.
std::optional<std::uint64_t> fileSize(const std::string& path);

// What tells whether a file is the one seen before: every atomic replacement changes it.
struct FileIdentity {
  std::uint64_t device = 0, inode = 0, size = 0;
  std::int64_t modifiedNanoseconds = 0;
  bool operator==(const FileIdentity&) const = default;
};
// Empty when there is no such file.
std::optional<FileIdentity> fileIdentity(const std::string& path);

// Names of the entries of a folder, sorted; an absent folder has none.
Result<std::vector<std::string>> listFolder(const std::string& path);
Status makeFolders(const std::string& path, unsigned mode = 0755);
// Removing what is not there succeeds.
Status removeFile(const std::string& path);
Status renameFile(const std::string& from, const std::string& to);
// Makes renames and removals in the folder survive a power cut.
Status syncFolder(const std::string& path);
// Bytes that an ordinary user can still write on the volume that holds path.
std::optional<std::uint64_t> freeSpace(const std::string& path);

// A file being written under a temporary name. Unless commit() succeeds the destructor removes it.
class TemporaryFile {
 public:
  // Opens a new file beside path, with mode.
  static Result<TemporaryFile> beside(const std::string& path, unsigned mode = 0600);
  TemporaryFile(TemporaryFile&& other) noexcept;
  TemporaryFile& operator=(TemporaryFile&&) = delete;
  ~TemporaryFile();
  // Writes all bytes or fails.
  Status write(std::string_view bytes);
  // fsync, rename to the final path, fsync of the folder.
  Status commit();

 private:
  TemporaryFile(std::string path, std::string temporary, int descriptor)
      : path_(std::move(path)), temporary_(std::move(temporary)), descriptor_(descriptor) {}
  std::string path_, temporary_;
  int descriptor_ = -1;
};

// True for the names that TemporaryFile gives, so that left-overs of a killed run can be swept.
bool isTemporaryName(std::string_view name);

// An exclusive lock on a file, released when the object or the process ends, however it ends.
class FileLock {
 public:
  // Makes the file if needed and waits until the lock is free.
  static Result<FileLock> acquire(const std::string& path);
  FileLock(FileLock&& other) noexcept;
  FileLock& operator=(FileLock&& other) noexcept;
  ~FileLock();

 private:
  explicit FileLock(int descriptor) : descriptor_(descriptor) {}
  int descriptor_ = -1;
};

// True when name can stand as one component of a path: not empty, not "." or "..", no '/', no NUL,
// at most 200 bytes. Everything that names a file and came from outside is checked with this.
bool isSafeFileName(std::string_view name);

}  // namespace tally
