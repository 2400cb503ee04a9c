// SystemTree: what the kernel shows of itself in /proc and /sys; of this machine, or of a
// recording.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/file.h"

namespace tally {

// How a path is asked for.
enum class TreeUse : std::uint8_t { Exists, List, Read };
// Told of every path before it is looked for, whether there is something or not.
using TreeObserver = std::function<void(const std::string& path, TreeUse use)>;

// What is at a path, a link not being followed.
struct TreeEntry {
  enum class Type : std::uint8_t { File, Directory, Link, Other } type;
  std::string target;  // of a link
};

// Paths are absolute ("/proc/stat"). Links are followed, since /sys consists of them, but never out
// of the device root. Whatever cannot be opened or read is missing, with errno saying why. Only
// regular files and directories are opened. Any thread.
class SystemTree {
 public:
  // Nothing is opened before it is asked for. follow: a recording's samples are served as time
  // passes, from the first call on; otherwise only the first is.
  explicit SystemTree(const DeviceRoot& root, bool follow = false, TreeObserver observer = {});
  ~SystemTree();
  SystemTree(const SystemTree&) = delete;
  SystemTree& operator=(const SystemTree&) = delete;

  // Whether this is the running machine, and not a recording or a described device.
  bool isThisMachine() const { return prefix_.empty(); }
  // Whether it is a recording: a device root with /proc.
  bool isRecording() const { return !isThisMachine() && exists("/proc"); }

  // A file for reading; empty, with errno, if there is none.
  Descriptor open(const std::string& path) const;
  // The names in a directory in natural order ("cpu2" before "cpu10"); none if it is missing.
  std::vector<std::string> list(const std::string& path) const;
  bool exists(const std::string& path) const;
  // The content without white space at its ends; empty if it cannot be read or is larger than
  // limit.
  std::optional<std::string> text(const std::string& path, std::size_t limit = 4096) const;
  std::optional<std::int64_t> number(const std::string& path) const;
  // The text of a file of the recording; below a root that is none, of this machine.
  std::optional<std::string> fact(const std::string& path, std::size_t limit = 4096) const;
  // What is at a path; empty, with errno, if nothing is.
  std::optional<TreeEntry> examine(const std::string& path) const;
  // Where a path leads with all links resolved, below the root: "/sys/devices/pci0000:00/...".
  std::optional<std::string> resolve(const std::string& path) const;

  // Changes whenever a file may have become another, so that open ones have to be opened again.
  std::size_t generation() const;

 private:
  struct Recording;
  int openAt(const std::string& path, int flags) const;
  int openSample(const std::string& path, int flags) const;
  int root() const;

  std::string prefix_;
  bool follow_;
  TreeObserver observer_;
  mutable std::mutex opening_;
  mutable Descriptor root_;
  mutable std::unique_ptr<Recording> recording_;
};

}  // namespace tally
