// The kernel's statistics as entries of the device registry.
#pragma once

#include <chrono>
#include <memory>
#include <optional>

#include "host/kernel/kernel_region.h"
#include "host/registry/registry_source.h"

namespace tally {

// Looks for devices when it is asked, at most every ten seconds. No entries exist when the
// device shows nothing.
class KernelStatistics final : public RegistrySource {
 public:
  explicit KernelStatistics(KernelDevice device) : device_(std::move(device)) {}

  std::shared_ptr<const Entries> entries() override;
  std::unique_ptr<UserClient> open(const RegistryEntry& entry, std::uint32_t type,
                                   RegistryResult* result) override;

 private:
  KernelDevice device_;
  std::optional<std::chrono::steady_clock::time_point> looked_;
  std::shared_ptr<const KernelChannels> channels_;
  std::shared_ptr<const Entries> entries_;
};

}  // namespace tally
