#include "host/flash/linux_flash_disks.h"

#include <algorithm>

#include "host/flash/flash_source.h"
#include "host/registry/source_registry.h"

namespace tally {

std::vector<FlashDisk> LinuxFlashDisks::disks() {
  std::vector<FlashDisk> found;
  if (isDescribed_()) return found;
  const auto disks = reader_.disks();
  const std::string storage = reader_.deviceDisk(disks);
  for (const Disk& disk : disks) {
    found.push_back({disk.name, disk.kind, reader_.identity(disk), disk.isRemovable,
                     disk.name == storage, reader_.wear(disk)});
  }
  return found;
}

std::shared_ptr<DeviceRegistry> LinuxFlashDisks::registryOf(std::string_view name) {
  const auto disks = reader_.disks();
  const auto disk = std::ranges::find(disks, name, &Disk::name);
  if (disk == disks.end() || !reader_.mayTellWear(*disk)) return nullptr;
  std::vector<std::unique_ptr<RegistrySource>> sources;
  sources.push_back(std::make_unique<FlashSource>(reader_, std::string(name)));
  return std::make_shared<SourceRegistry>(std::move(sources));
}

}  // namespace tally
