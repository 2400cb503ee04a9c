// The files that a device description names, in its own directory or below.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "kv/value.h"
#include "platform/system_log.h"

namespace tally {

// No described buffer is larger.
constexpr std::size_t kDescribedBytesLimit = 64u << 20;

class DescribedFiles {
 public:
  DescribedFiles(DeviceDirectory folder, std::shared_ptr<SystemLog> log)
      : folder_(std::move(folder)), log_(std::move(log)) {}

  // What a description gives as bytes: a data value itself, or the content of the file that a
  // string names. Empty, with one error line, when that is missing, leads out of the folder, or is
  // too large.
  std::optional<std::vector<std::byte>> bytes(const KvObject& described);
  // A fault of the description; the kind is as for SystemLog::fault.
  void report(std::string_view kind, std::string_view fault) const;

 private:
  DeviceDirectory folder_;
  std::shared_ptr<SystemLog> log_;
};

}  // namespace tally
