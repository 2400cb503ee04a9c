// The device's flash disk as a storage driver of the registry.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "base/files/device_root.h"
#include "host/flash/disk_reader.h"
#include "host/registry/registry_source.h"

namespace tally {

// Of the one entry: above those of a description, which are numbered from 0x100 by default.
constexpr std::uint64_t kFlashEntryID = 0x464C'0000'0000;

class FlashSource final : public RegistrySource {
 public:
  // Publishes the disk of that name, or without one the disk of the device's data. Nothing is read
  // before it is asked for, and no disk is woken before its driver is called.
  explicit FlashSource(DiskReader reader, std::string name = {})
      : reader_(std::move(reader)), name_(std::move(name)) {}

  std::shared_ptr<const Entries> entries() override;
  std::unique_ptr<UserClient> open(const RegistryEntry& entry, std::uint32_t type,
                                   RegistryResult* result) override;

 private:
  std::shared_ptr<const Entries> find() const;

  DiskReader reader_;
  std::string name_;
  std::shared_ptr<const Entries> none_ = std::make_shared<Entries>(), found_;
  std::chrono::steady_clock::time_point lookAgain_{};
};

}  // namespace tally
