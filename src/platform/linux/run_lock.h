// Turns between processes, by a lock file.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/file.h"
#include "platform/run_lock.h"
#include "platform/system_log.h"

namespace tally {

// When the lock file cannot be made, one error line says so and the run goes on without turns.
class FileRunLock final : public RunLock {
 public:
  FileRunLock(std::string path, std::shared_ptr<SystemLog> log)
      : path_(std::move(path)), log_(std::move(log)) {}
  void enter() override;
  void leave() override;

 private:
  std::string path_;
  std::shared_ptr<SystemLog> log_;
  std::optional<FileLock> lock_;
  int depth_ = 0;
  bool reported_ = false;
};

}  // namespace tally
