// The device root: where every path of the device begins, and the walk down from it.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "base/files/directory.h"

namespace tally {

// Paths are those of the device ("/var/mobile"); ".." is rejected. A link on the way is followed
// when root (or the program's own user) owns it and nobody else can write any directory down to it,
// as where a system keeps /var on another volume; its target is taken below the root too. Below the
// first directory that another user can write, no link is followed. The root itself is the caller's
// choice and may be a link.
class DeviceRoot {
 public:
  // "" is this machine's "/". Nothing is opened.
  DeviceRoot(std::string path);

  // Without a slash at its end, so that an absolute path of the device can follow.
  const std::string& prefix() const { return prefix_; }

  Result<Directory> open(std::string_view path) const;
  // Makes the missing directories durably; the last one with the mode.
  Result<Directory> make(std::string_view path, unsigned mode = 0755) const;

  // As of Directory, for a file at a path. ENOENT when a directory on the way is missing.
  Result<std::string> readFile(std::string_view path, std::size_t limit) const;
  Result<FileReader> openForReading(std::string_view path, std::size_t limit) const;
  std::optional<FileIdentity> identity(std::string_view path) const;

 private:
  struct Location {
    Directory directory;
    std::string name;
  };
  struct Opened;
  Result<Directory> openRoot() const;
  Result<Directory> walk(std::string_view path) const;
  // followsLinks: for the last component; on the way they always are.
  // What read(directory, name) returns for the file at a path.
  template <class Read>
  auto readAt(std::string_view path, Read read) const
      -> decltype(read(std::declval<const Directory&>(), std::string()));
  Result<Location> locate(std::string_view path, bool followsLinks) const;

  std::string prefix_;
  std::shared_ptr<Opened> opened_;  // the root once it was found, shared by copies
};

// A directory of a device, opened again for each use.
class DeviceDirectory {
 public:
  DeviceDirectory(DeviceRoot root, std::string path)
      : root_(std::move(root)), path_(std::move(path)) {
    path_.resize(path_.find_last_not_of('/') + 1);
  }

  // For messages.
  std::string text() const { return root_.prefix() + path_; }
  const DeviceRoot& root() const { return root_; }
  Result<Directory> open() const { return root_.open(path_); }
  Result<Directory> make(unsigned mode = 0755) const { return root_.make(path_, mode); }
  // A file in it, or below it; as of DeviceRoot.
  Result<std::string> readFile(std::string_view name, std::size_t limit) const {
    return root_.readFile(path_ + "/" + std::string(name), limit);
  }
  std::optional<FileIdentity> identity(std::string_view name) const {
    return root_.identity(path_ + "/" + std::string(name));
  }
  // Sorted; empty if the directory does not exist.
  Result<std::vector<std::string>> list() const;

 private:
  DeviceRoot root_;
  std::string path_;
};

}  // namespace tally
