// The flash disks that the kernel shows.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/device_registry.h"
#include "platform/flash/wear.h"

namespace tally {

struct FlashDisk {
  std::string name;  // as the kernel calls it: "mmcblk0"
  DiskKind kind = DiskKind::Other;
  std::string identity;  // distinguishes it from a disk that replaces it; empty: not known
  bool isRemovable = false;
  bool isStorage = false;  // the disk that the device's data lies on
  std::optional<Wear> wear;
};

// This class is that of a platform without any.
class FlashDisks {
 public:
  virtual ~FlashDisks() = default;
  // Every disk, with what it says now; reading may wake it. None on a device whose storage driver
  // is described.
  virtual std::vector<FlashDisk> disks() { return {}; }
  // A registry whose storage driver exports the figures of this disk; null if there is no such disk
  // or nothing is known of its wear.
  virtual std::shared_ptr<DeviceRegistry> registryOf(std::string_view) { return nullptr; }
};

}  // namespace tally
