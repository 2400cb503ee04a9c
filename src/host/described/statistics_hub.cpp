#include "host/described/statistics_hub.h"

#include <algorithm>
#include <cstring>
#include <set>
#include <unordered_map>

#include "base/byte_reader.h"
#include "host/described/hub_region.h"
#include "host/described/injected_result.h"
#include "host/described/shared_memory.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

// A connection has one subscription only, whose memory type is the token.
constexpr std::uint64_t kToken = 0x5442;

class StatisticsHubClient final : public UserClient {
 public:
  StatisticsHubClient(KvRef<KvDictionary> description,
                      std::shared_ptr<const RegistrySource::Entries> drivers,
                      std::shared_ptr<DescribedFiles> files)
      : description_(std::move(description)),
        drivers_(std::move(drivers)),
        files_(std::move(files)) {}
  ~StatisticsHubClient() override {
    for (const std::byte* address : mappings_) memory_->unmap(address);
  }

  RegistryResult call(std::uint32_t selector, MethodCall& call) override {
    switch (selector) {
      case kHubOpen:
        return start();
      case kHubConfigureInterests:
        return configure(call);
      case kHubUpdate:
        return update(call);
      default:
        return kRegistryUnsupported;
    }
  }

  RegistryResult map(std::uint32_t memoryType, std::span<const std::byte>* memory) override {
    if (const auto status = injectedResult(description_.get(), "MapStatus")) return status;
    if (!memory_ || memoryType != static_cast<std::uint32_t>(kToken)) return kRegistryBadArgument;
    const std::byte* const address = memory_->map();
    if (address == nullptr) return kRegistryNoMemory;
    mappings_.insert(address);
    *memory = {address, memory_->writable().size()};
    return kRegistrySuccess;
  }

  RegistryResult unmap(std::uint32_t memoryType, const std::byte* address) override {
    if (memoryType != static_cast<std::uint32_t>(kToken) || mappings_.erase(address) == 0) {
      return kRegistryBadArgument;
    }
    memory_->unmap(address);
    return kRegistrySuccess;
  }

 private:
  RegistryResult start() {
    if (const auto status = injectedResult(description_.get(), "StartStatus")) return status;
    started_ = true;
    return kRegistrySuccess;
  }

  RegistryResult configure(MethodCall& call) {
    if (!started_) return kRegistryNotOpen;
    if (const auto status = injectedResult(description_.get(), "ConfigureStatus")) return status;
    const auto interests = parseInterestList(call.structInput);
    if (!interests || call.scalarOutput.empty() || memory_) return kRegistryBadArgument;
    region_ = makeRegion(*interests);
    if (!region_) return kRegistryNoMemory;
    memory_ = SharedMemory::create(region_->size());
    if (!memory_) return kRegistryNoMemory;
    region_->writeFrame(0, memory_->writable());
    call.scalarOutput[0] = kToken;
    call.scalarOutputCount = 1;
    return kRegistrySuccess;
  }

  std::unique_ptr<HubRegion> makeRegion(const std::vector<Interest>& interests) {
    const auto* raw = description_ ? description_->getAs<KvArray>("RawFrames") : nullptr;
    return raw != nullptr ? makeRawRegion(*raw, *files_)
                          : makeChannelRegion(interests, *drivers_, *files_);
  }

  RegistryResult update(MethodCall& call) {
    if (!memory_) return kRegistryNotOpen;
    if (call.scalarInput.size() != 1 || call.scalarInput[0] != kToken) return kRegistryBadArgument;
    if (const auto status = injectedResult(description_.get(), "UpdateStatus")) return status;
    region_->writeFrame(refreshes_++, memory_->writable());
    return kRegistrySuccess;
  }

  KvRef<KvDictionary> description_;
  std::shared_ptr<const RegistrySource::Entries> drivers_;
  std::shared_ptr<DescribedFiles> files_;
  bool started_ = false;
  std::size_t refreshes_ = 0;
  std::unique_ptr<HubRegion> region_;
  std::unique_ptr<SharedMemory> memory_;
  std::set<const std::byte*> mappings_;
};

}  // namespace

std::unique_ptr<UserClient> openStatisticsHub(
    KvRef<KvDictionary> description, std::shared_ptr<const RegistrySource::Entries> drivers,
    std::shared_ptr<DescribedFiles> files, RegistryResult* result) {
  *result = injectedResult(description.get(), "OpenStatus");
  if (*result != kRegistrySuccess) return nullptr;
  return std::make_unique<StatisticsHubClient>(std::move(description), std::move(drivers),
                                               std::move(files));
}

}  // namespace tally
