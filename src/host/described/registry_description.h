// The registry entries that a device root describes in device/registry.plist.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/files/device_root.h"
#include "host/described/described_files.h"
#include "host/registry/registry_source.h"

namespace tally {

class RegistryDescription final : public RegistrySource {
 public:
  // folder has registry.plist and the files that it names. Nothing is read before it is asked
  // for; a changed file is read again.
  RegistryDescription(DeviceDirectory folder, std::shared_ptr<SystemLog> log);

  std::shared_ptr<const Entries> entries() override;
  std::unique_ptr<UserClient> open(const RegistryEntry& entry, std::uint32_t type,
                                   RegistryResult* result) override;

 private:
  std::shared_ptr<const Entries> read();

  DeviceDirectory folder_;
  std::shared_ptr<DescribedFiles> files_;
  std::optional<FileIdentity> identity_;
  std::shared_ptr<const Entries> entries_;
};

}  // namespace tally
