// Reads what disks say, each kind in its own way.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/files/device_root.h"
#include "host/flash/disk_list.h"
#include "platform/clock.h"
#include "platform/flash/wear.h"

namespace tally {

// Copies share the tree.
class DiskReader {
 public:
  // Without a clock nothing is known of the age of NVMe pages. The tree is that of the root.
  DiskReader(DeviceRoot root, std::shared_ptr<Clock> clock, std::shared_ptr<const SystemTree> tree)
      : root_(std::move(root)), clock_(std::move(clock)), tree_(std::move(tree)) {}

  std::vector<Disk> disks() const { return listDisks(*tree_); }
  std::string deviceDisk(const std::vector<Disk>& disks) const {
    return tally::deviceDisk(*tree_, disks);
  }
  // Whether wear() may find something. Asks no disk.
  bool mayTellWear(const Disk& disk) const;
  std::optional<Wear> wear(const Disk& disk) const;
  // What distinguishes the disk from one that replaces it; empty if nothing does.
  std::string identity(const Disk& disk) const;

 private:
  DeviceRoot root_;
  std::shared_ptr<Clock> clock_;
  std::shared_ptr<const SystemTree> tree_;
};

}  // namespace tally
