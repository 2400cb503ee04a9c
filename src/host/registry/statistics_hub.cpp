#include "host/registry/statistics_hub.h"

#include <algorithm>
#include <cstring>
#include <set>
#include <unordered_map>

#include "base/byte_reader.h"
#include "host/registry/injected_result.h"
#include "host/registry/shared_memory.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

// A connection has one subscription only, whose memory type is the token.
constexpr std::uint64_t kToken = 0x5442;

// The entries of an interest list; empty unless its count and its length agree.
std::optional<std::vector<Interest>> parseInterestList(std::span<const std::byte> list) {
  const ByteReader reader(list);
  const auto count = reader.read<std::uint32_t>(0);
  const auto reserved = reader.read<std::uint32_t>(4);
  if (!count || reserved != 0u || *count == 0 || *count > kMostInterests) return std::nullopt;
  if (list.size() != kInterestHeaderSize + kInterestSize * *count) return std::nullopt;
  std::vector<Interest> interests(*count);
  for (std::size_t i = 0; i < interests.size(); ++i) {
    const std::size_t offset = kInterestHeaderSize + kInterestSize * i;
    interests[i] = {*reader.read<std::uint64_t>(offset), *reader.read<std::uint64_t>(offset + 8),
                    *reader.read<std::uint64_t>(offset + 16)};
  }
  return interests;
}

class StatisticsHubClient final : public UserClient {
 public:
  StatisticsHubClient(RegionMaker makeRegion, KvRef<KvDictionary> failures)
      : makeRegion_(std::move(makeRegion)), failures_(std::move(failures)) {}
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
    if (const auto status = injectedResult(failures_.get(), "MapStatus")) return status;
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
    if (const auto status = injectedResult(failures_.get(), "StartStatus")) return status;
    started_ = true;
    return kRegistrySuccess;
  }

  RegistryResult configure(MethodCall& call) {
    if (!started_) return kRegistryNotOpen;
    if (const auto status = injectedResult(failures_.get(), "ConfigureStatus")) return status;
    const auto interests = parseInterestList(call.structInput);
    if (!interests || call.scalarOutput.empty() || memory_) return kRegistryBadArgument;
    region_ = makeRegion_(*interests);
    if (!region_) return kRegistryNoMemory;
    memory_ = SharedMemory::create(region_->size());
    if (!memory_) return kRegistryNoMemory;
    if (region_->hasFirstFrame()) region_->writeFrame(0, memory_->writable());
    call.scalarOutput[0] = kToken;
    call.scalarOutputCount = 1;
    return kRegistrySuccess;
  }

  RegistryResult update(MethodCall& call) {
    if (!memory_) return kRegistryNotOpen;
    if (call.scalarInput.size() != 1 || call.scalarInput[0] != kToken) return kRegistryBadArgument;
    if (const auto status = injectedResult(failures_.get(), "UpdateStatus")) return status;
    region_->writeFrame(refreshes_++, memory_->writable());
    return kRegistrySuccess;
  }

  RegionMaker makeRegion_;
  KvRef<KvDictionary> failures_;
  bool started_ = false;
  std::size_t refreshes_ = 0;
  std::unique_ptr<HubRegion> region_;
  std::unique_ptr<SharedMemory> memory_;
  std::set<const std::byte*> mappings_;
};

}  // namespace

std::unique_ptr<UserClient> openStatisticsHub(RegionMaker makeRegion, KvRef<KvDictionary> failures,
                                              RegistryResult* result) {
  *result = injectedResult(failures.get(), "OpenStatus");
  if (*result != kRegistrySuccess) return nullptr;
  return std::make_unique<StatisticsHubClient>(std::move(makeRegion), std::move(failures));
}

}  // namespace tally
