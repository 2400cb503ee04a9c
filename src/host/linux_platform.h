// The Linux platform: every service below a device root.
#pragma once

#include <memory>

#include "host/described/device_description.h"
#include "host/tree/system_tree.h"
#include "platform/platform.h"

namespace tally {

// How a platform differs from that of the daily job.
struct LinuxPlatformOptions {
  std::shared_ptr<SystemLog> log;  // null: the journal or standard error
  bool readOnlyPreferences = false;
  // Null: that of the root, of a recording its first sample.
  std::shared_ptr<const SystemTree> tree = nullptr;
  std::shared_ptr<Clock> clock = nullptr;  // null: the system's
};

// All services of the device whose root is the folder. Cheap: nothing is opened or read before a
// service is used.
Platform makeLinuxPlatform(const DeviceRoot& root, const LinuxPlatformOptions& options = {});

}  // namespace tally
