// Directory: an open directory, through which every file of the device is reached.
//
// Root works in directories that users own and change while it works. Each call looks a path up
// again, so the file that is used may not be the one that was checked; an open directory stays the
// same. Names are single components, and a symbolic link at a name is never followed.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/file.h"
#include "base/result.h"

struct stat;

namespace tally {

// Distinguishes a file from the one seen before: every atomic replacement changes it.
struct FileIdentity {
  std::uint64_t device = 0, inode = 0, size = 0;
  std::int64_t modifiedNanoseconds = 0;
  bool regular = false;
  bool operator==(const FileIdentity&) const = default;
};

// Copies share one descriptor. The path is used in error messages only.
class Directory {
 public:
  // Opens a path that the caller chose, links included. It is the device root of what is opened
  // through it.
  static Result<Directory> open(const std::string& path);

  const std::string& path() const { return path_; }
  std::string pathOf(std::string_view name) const;
  int descriptor() const { return descriptor_->get(); }
  // Whether it still has a name.
  bool exists() const;

  // The directory at a name, or at a path of several names. An error (ELOOP) if one is a link.
  Result<Directory> openDirectory(std::string_view name) const;
  Result<Directory> openBelow(std::string_view path) const;
  // The same; created durably if it is missing. Directories and files that root creates in another
  // user's directory belong to that user, who could not read them otherwise.
  Result<Directory> makeDirectory(std::string_view name, unsigned mode = 0755) const;

  // The whole file; larger ones than limit are refused without reading them. Only a regular file is
  // opened, and below a directory that another user can write only one that has a single name and
  // belongs to that user or to root: any other may be somebody else's file under this name (EPERM,
  // EMLINK).
  Result<std::string> readFile(std::string_view name, std::size_t limit) const;
  // Opens such a file to read it piece by piece.
  Result<FileReader> openForReading(std::string_view name, std::size_t limit) const;
  // Opens a file for writing under the same conditions.
  Result<Descriptor> openForWriting(std::string_view name) const;
  // Creates a file, which must not exist yet (EEXIST).
  Result<Descriptor> create(std::string_view name, unsigned mode) const;
  // Creates a file with its content, and a link; neither is durable before sync...() returns.
  Status writeNew(std::string_view name, std::string_view contents, unsigned mode = 0644) const;
  Status makeLink(const std::string& target, std::string_view name) const;
  // Whether a file that was opened in this directory meets the conditions above.
  Status check(int file, std::string_view name) const;

  // Empty when nothing is there or it cannot be examined. A link is examined itself.
  std::optional<FileIdentity> identity(std::string_view name) const;
  // The target of a link in this directory that may be followed: it belongs to root or the
  // program's own user, and nobody else can write here. Empty for anything else.
  std::optional<std::string> trustedLink(std::string_view name) const;
  // Names of the entries, sorted.
  Result<std::vector<std::string>> list() const;
  // Removing a missing entry succeeds.
  Status remove(std::string_view name) const;
  // Removes a directory with everything in it; no link is followed.
  Status removeTree(std::string_view name) const;
  Status rename(std::string_view from, std::string_view to) const;
  // The same, but never replaces a file (EEXIST). A file system that cannot promise that is asked
  // before, so another writer may still come between.
  Status renameToNew(std::string_view from, std::string_view to) const;
  // Makes creations, renames and removals in this directory survive a power cut.
  Status sync() const;
  // The same for everything on its volume.
  Status syncVolume() const;
  // Bytes that an ordinary user can still write on the volume.
  std::optional<std::uint64_t> freeSpace() const;

 private:
  struct Place {
    std::uint64_t device = 0, inode = 0;
    bool operator==(const Place&) const = default;
  };
  // Who may change what is reached through the directory.
  struct Trust {
    // Only root and the program's own user can write it and those above it, up to the device root.
    bool exclusive = true;
    // The other user in whose directory it lies.
    std::optional<uid_t> user;
  };
  // Without a root, the directory is one.
  Directory(Descriptor descriptor, std::string path, const Directory* root);
  Result<Descriptor> openFile(std::string_view name, int flags) const;
  void giveToOwner(int descriptor, const struct stat& made) const;
  // Looks at the directories above, so it is asked for only where something is unusual.
  Trust trust() const;

  std::shared_ptr<Descriptor> descriptor_;
  std::string path_;
  Place root_;
  uid_t owner_ = 0;
  gid_t group_ = 0;
};

}  // namespace tally
