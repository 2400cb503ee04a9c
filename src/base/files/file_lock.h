// File locks, for which every wait is bounded.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string_view>
#include <utility>

#include "base/files/directory.h"
#include "base/files/file.h"
#include "base/result.h"

namespace tally {

// An exclusive lock on a file, released when the object or the process ends, however it ends.
class FileLock {
 public:
  // Makes the file if needed and waits for the lock, at most for the given time; then an error
  // (EWOULDBLOCK) names the process that holds it.
  static Result<FileLock> acquire(const Directory& directory, std::string_view name,
                                  std::chrono::milliseconds patience);
  // The same within what remains of the process's total waiting time of one minute, so that
  // processes that never release their locks cannot delay a run by more than that.
  static Result<FileLock> acquire(const Directory& directory, std::string_view name);

 private:
  explicit FileLock(Descriptor file) : file_(std::move(file)) {}
  Descriptor file_;
};

// The process that holds the lock on a file of this kind, from the text of /proc/locks; empty when
// it does not say.
std::optional<std::int64_t> lockHolder(std::string_view locks, std::uint64_t device,
                                       std::uint64_t inode);

}  // namespace tally
