#include "host/system/run_lock.h"

#include <fmt/core.h>

#include <cerrno>

#include "platform/metrics_store.h"

namespace tally {
namespace {

constexpr std::string_view kLockName = "tallyrun.lock";

}  // namespace

DeviceDirectory runLockFolder(const DeviceRoot& root) {
  return {root, std::string(kStorePath.substr(0, kStorePath.rfind('/')))};
}

bool FileRunLock::enter() {
  if (depth_ > 0) {
    ++depth_;
    return true;
  }
  const auto folder = folder_.make();
  auto lock =
      folder ? FileLock::acquire(*folder, kLockName, patience_) : Result<FileLock>(folder.error());
  const bool busy = !lock && lock.error().systemError == EWOULDBLOCK;
  if (lock) {
    lock_.emplace(std::move(*lock));
  } else if (!std::exchange(reported_, true)) {
    log_->write(LogLevel::Error, fmt::format("run lock: {}{}", lock.error().message,
                                             busy ? "; nothing is done" : ""));
  }
  if (busy) return false;
  ++depth_;
  return true;
}

void FileRunLock::leave() {
  if (depth_ > 0 && --depth_ == 0) lock_.reset();
}

}  // namespace tally
