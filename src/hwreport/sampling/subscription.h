// A subscription's connection to the statistics hub.
#pragma once

#include <cstdint>
#include <memory>
#include <span>

#include "hwreport/error.h"
#include "hwreport/samples.h"
#include "platform/device_registry.h"

namespace tally {

class Subscription final : public HwReportSubscription {
 public:
  // Keeps the registry that its connection belongs to, so that it can always close it.
  explicit Subscription(std::shared_ptr<DeviceRegistry> registry)
      : registry_(std::move(registry)) {}
  // Unmaps and closes what was set up.
  ~Subscription();

  // Finds the hub, opens it, configures the interests and maps its region.
  HwResult connect(std::span<const std::byte> interests, KvRef<HwReportError>* error);
  // Has the hub write the current elements into the region.
  HwResult update();
  std::span<const std::byte> region() const noexcept { return {address_, length_}; }

 private:
  HwResult openHub(KvRef<HwReportError>* error);
  HwResult configure(std::span<const std::byte> interests, KvRef<HwReportError>* error);
  HwResult mapRegion(KvRef<HwReportError>* error);
  std::uint32_t memoryType() const noexcept { return static_cast<std::uint32_t>(token_); }

  const std::shared_ptr<DeviceRegistry> registry_;
  ConnectionHandle connection_ = 0;
  std::uint64_t token_ = 0;
  const std::byte* address_ = nullptr;
  std::size_t length_ = 0;
};

}  // namespace tally
