// The disks that the kernel shows, and which of them a block device lies on.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/tree/system_tree.h"
#include "platform/flash/wear.h"

namespace tally {

struct Disk {
  std::string name;
  DiskKind kind = DiskKind::Other;
  bool isRemovable = false;
  std::string controller;  // of UFS its folder, of NVMe its name
};

// Physical disks and UBI devices, in natural order; a card's boot areas belong to the card.
std::vector<Disk> listDisks(const SystemTree& tree);

// The block device of a number ("259:2"); empty if there is none.
std::string blockDeviceOf(const SystemTree& tree, std::string_view number);

// The disk that holds the device's data, whatever lies between: partitions, volumes, arrays, loops,
// overlays. If nothing says it, the only disk that is not removable. Empty if there is none.
std::string deviceDisk(const SystemTree& tree, const std::vector<Disk>& disks);

}  // namespace tally
