#include "platform/linux/run_lock.h"

#include <fmt/format.h>

namespace tally {

void FileRunLock::enter() {
  if (depth_++ > 0) return;
  auto lock = FileLock::acquire(path_);
  if (lock) {
    lock_.emplace(std::move(*lock));
  } else if (!std::exchange(reported_, true)) {
    log_->write(LogLevel::Error, fmt::format("run lock: {}", lock.error().message));
  }
}

void FileRunLock::leave() {
  if (depth_ > 0 && --depth_ == 0) lock_.reset();
}

}  // namespace tally
