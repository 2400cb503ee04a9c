// Serialises runs of several processes by a lock file.
#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <string>

#include "base/files/device_root.h"
#include "base/files/file_lock.h"
#include "platform/run_lock.h"
#include "platform/system_log.h"

namespace tally {

// Where a device's lock lies: beside the metrics store.
DeviceDirectory runLockFolder(const DeviceRoot& root);

// When the lock file cannot be made, one error line says so and the run goes on without a lock: a
// run on a read-only device still does its work.
class FileRunLock final : public RunLock {
 public:
  static constexpr std::chrono::minutes kPatience{10};
  FileRunLock(DeviceDirectory folder, std::shared_ptr<SystemLog> log,
              std::chrono::milliseconds patience = kPatience)
      : folder_(std::move(folder)), log_(std::move(log)), patience_(patience) {}
  bool enter() override;
  void leave() override;

 private:
  DeviceDirectory folder_;
  std::shared_ptr<SystemLog> log_;
  std::chrono::milliseconds patience_;
  std::optional<FileLock> lock_;
  int depth_ = 0;
  bool reported_ = false;
};

}  // namespace tally
