// The flash disks of the machine, or of a recording.
#pragma once

#include <functional>

#include "host/flash/disk_reader.h"
#include "platform/flash/flash_disks.h"

namespace tally {

class LinuxFlashDisks final : public FlashDisks {
 public:
  // isDescribed: whether the device describes its storage driver.
  LinuxFlashDisks(DiskReader reader, std::function<bool()> isDescribed)
      : reader_(std::move(reader)), isDescribed_(std::move(isDescribed)) {}

  std::vector<FlashDisk> disks() override;
  std::shared_ptr<DeviceRegistry> registryOf(std::string_view name) override;

 private:
  DiskReader reader_;
  std::function<bool()> isDescribed_;
};

}  // namespace tally
