#include "host/kernel/kernel_statistics.h"

#include "host/registry/statistics_hub.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

// A client that asks for the same channel again and again gets no more memory than this allows.
constexpr std::size_t kMostInterestsServed = 1u << 19;

}  // namespace

std::shared_ptr<const RegistrySource::Entries> KernelStatistics::entries() {
  constexpr std::chrono::seconds kBetweenLooks{10};
  const auto now = std::chrono::steady_clock::now();
  if (looked_ && now - *looked_ < kBetweenLooks) return entries_;
  looked_ = now;
  auto channels = std::make_shared<const KernelChannels>(*device_.tree);
  if (channels_ && channels->isSame(*channels_)) return entries_;
  channels_ = std::move(channels);
  entries_ = std::make_shared<const Entries>(channels_->entries());
  return entries_;
}

std::unique_ptr<UserClient> KernelStatistics::open(const RegistryEntry& entry, std::uint32_t type,
                                                   RegistryResult* result) {
  *result = kRegistryUnsupported;
  if (type != 0 || entry.className != kStatisticsHubClass) return nullptr;
  const auto makeRegion =
      [channels = channels_,
       device = device_](const std::vector<Interest>& interests) -> std::unique_ptr<HubRegion> {
    if (interests.size() > kMostInterestsServed) return nullptr;
    return std::make_unique<KernelRegion>(interests, channels, device);
  };
  return openStatisticsHub(makeRegion, nullptr, result);
}

}  // namespace tally
