// A device of many statistics channels in memory: drivers with legends, and the hub.
#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "platform/device_registry.h"

namespace tally::bench {

// Every driver publishes this many channels, in four groups, one for each format.
constexpr std::size_t kChannelsPerDriver = 100;

// Drivers whose channels are of mixed formats: of every ten 4 simple, 2 with six states, 2
// histograms of ten buckets, 2 arrays of twelve values. The hub lays their runs out in shuffled
// order; an update changes every value.
class ChannelWorld final : public DeviceRegistry {
 public:
  explicit ChannelWorld(std::size_t channels);
  const std::vector<std::byte>& region() const { return region_; }

  RegistryHandle RegistryFindService(KvRef<KvDictionary>) override { return kHub; }
  RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary>, RegistryHandle* out) override {
    next_ = 0;
    *out = kIterator;
    return 0;
  }
  RegistryHandle RegistryIteratorNext(RegistryHandle) override;
  bool RegistryIteratorIsValid(RegistryHandle) override { return true; }
  KvRef<KvObject> RegistryCopyProperty(RegistryHandle entry, std::string_view key) override;
  KvRef<KvObject> RegistrySearchProperty(RegistryHandle entry, std::string_view key) override {
    return RegistryCopyProperty(entry, key);
  }
  RegistryResult RegistryGetEntryID(RegistryHandle entry, std::uint64_t* id) override;
  RegistryResult RegistryGetName(RegistryHandle entry, std::string* name) override;
  std::uint32_t RegistryHandleIsValid(RegistryHandle) override { return 1; }
  void HandleRetain(RegistryHandle) override {}
  void HandleRelease(RegistryHandle) override {}
  RegistryResult ServiceOpenConnection(RegistryHandle, std::uint32_t,
                                       ConnectionHandle* connection) override {
    *connection = kHub;
    return 0;
  }
  RegistryResult ServiceCloseConnection(ConnectionHandle) override { return 0; }
  RegistryResult ConnectionCallMethod(ConnectionHandle, std::uint32_t selector,
                                      MethodCall& call) override;
  RegistryResult ConnectionMapMemory(ConnectionHandle, std::uint32_t, std::uint32_t,
                                     const std::byte** address, std::size_t* length) override {
    *address = region_.data();
    *length = region_.size();
    return 0;
  }
  RegistryResult ConnectionUnmapMemory(ConnectionHandle, std::uint32_t, const std::byte*) override {
    return 0;
  }

 private:
  static constexpr RegistryHandle kHub = 1, kIterator = 2, kFirstDriver = 16;
  void addDriver(std::size_t number, std::size_t channels);
  void layOut();

  struct Channel {
    std::uint64_t driverID, channelID, typeWord;
  };
  std::vector<KvRef<KvArray>> legends_;  // by driver
  std::vector<Channel> channels_;
  std::vector<std::byte> region_;
  std::size_t next_ = 0;
};

}  // namespace tally::bench
