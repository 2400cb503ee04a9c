// A device with a storage driver, in memory: each call can be made to fail, and every call is
// recorded. Also the other services that the storage library uses.
#pragma once

#include <algorithm>
#include <deque>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "fakes/fake_platform.h"
#include "fakes/statistics_buffer.h"

namespace tally::fakes {

struct FakeStorageRegistry : DeviceRegistry {
  struct Reply {
    Bytes bytes;
    RegistryResult status = 0;
  };
  std::set<std::string> classes{"SPXStorage"};
  std::deque<Reply> replies;  // of the method calls, in order; then 0xE00002C2
  std::map<std::string, KvRef<KvObject>, std::less<>> properties;  // of the service
  RegistryResult openStatus = 0, closeStatus = 0;
  std::vector<std::string> calls;
  int services = 0, connections = 0;  // not yet released

  RegistryHandle RegistryFindService(KvRef<KvDictionary> matching) override {
    const std::string name(*matching->getString(kMatchClass));
    if (!classes.contains(name)) return 0;
    calls.push_back("find " + name);
    ++services;
    return 7;
  }
  RegistryResult ServiceOpenConnection(RegistryHandle service, std::uint32_t type,
                                       ConnectionHandle* connection) override {
    calls.push_back("open " + std::to_string(service) + " type " + std::to_string(type));
    *connection = openStatus == 0 ? 9 : 0;
    connections += openStatus == 0;
    return openStatus;
  }
  RegistryResult ServiceCloseConnection(ConnectionHandle connection) override {
    calls.push_back("close " + std::to_string(connection));
    --connections;
    return closeStatus;
  }
  void HandleRelease(RegistryHandle) override { --services; }
  // Recorded as "call METHOD WORD WORD... -> ROOM", the words of the input without zeros at the
  // end.
  RegistryResult ConnectionCallMethod(ConnectionHandle, std::uint32_t method,
                                      MethodCall& call) override {
    std::string line = "call " + std::to_string(method);
    std::vector<std::uint32_t> words(call.structInput.size() / 4);
    if (!words.empty()) std::memcpy(words.data(), call.structInput.data(), words.size() * 4);
    line += " in " + std::to_string(call.structInput.size());
    while (!words.empty() && words.back() == 0) words.pop_back();
    for (const std::uint32_t word : words) line += " " + std::to_string(word);
    calls.push_back(line + " room " + std::to_string(call.structOutput.size()));
    if (replies.empty()) return 0xE00002C2;
    const Reply reply = std::move(replies.front());
    replies.pop_front();
    const std::size_t count = std::min(reply.bytes.size(), call.structOutput.size());
    std::copy_n(reply.bytes.begin(), count, call.structOutput.begin());
    call.structOutputSize = reply.bytes.size();  // may exceed the capacity
    return reply.status;
  }

  RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary>, RegistryHandle*) override {
    return 1;
  }
  RegistryHandle RegistryIteratorNext(RegistryHandle) override { return 0; }
  bool RegistryIteratorIsValid(RegistryHandle) override { return false; }
  KvRef<KvObject> RegistryCopyProperty(RegistryHandle, std::string_view) override { return {}; }
  KvRef<KvObject> RegistrySearchProperty(RegistryHandle, std::string_view key) override {
    const auto found = properties.find(key);
    return found == properties.end() ? nullptr : found->second;
  }
  RegistryResult RegistryGetEntryID(RegistryHandle, std::uint64_t*) override { return 1; }
  RegistryResult RegistryGetName(RegistryHandle, std::string*) override { return 1; }
  std::uint32_t RegistryHandleIsValid(RegistryHandle) override { return 1; }
  void HandleRetain(RegistryHandle) override { ++services; }
  RegistryResult ConnectionMapMemory(ConnectionHandle, std::uint32_t, std::uint32_t,
                                     const std::byte**, std::size_t*) override {
    return 1;
  }
  RegistryResult ConnectionUnmapMemory(ConnectionHandle, std::uint32_t, const std::byte*) override {
    return 1;
  }

  // The next fetch gets this buffer, of an announced size.
  void serve(const Bytes& buffer, std::size_t announced) {
    replies.clear();
    serveNext(buffer, announced);
  }
  // The fetch after those that are served already.
  void serveNext(const Bytes& buffer, std::size_t announced) {
    Bytes size;
    appendValue(size, static_cast<std::uint32_t>(announced));
    replies.push_back({size});
    replies.push_back({buffer});
  }
  void serveNext(const Bytes& buffer) { serveNext(buffer, buffer.size()); }
  void serve(const Bytes& buffer) { serve(buffer, buffer.size()); }
};

struct FakeStackshot final : Stackshot {
  bool exists = true;
  int flagsStatus = 0, captureStatus = 0;
  Bytes buffer;  // empty: no data
  int configs = 0;

  std::unique_ptr<StackshotConfig> stackshotConfigCreate() override {
    struct Config final : StackshotConfig {
      explicit Config(FakeStackshot& service) : service_(service) { ++service_.configs; }
      ~Config() override { --service_.configs; }
      int stackshotConfigSetFlags(std::uint32_t flags) override {
        return flags == 0x10000 ? service_.flagsStatus : 22;
      }
      int stackshotCapture() override { return service_.captureStatus; }
      std::span<const std::byte> stackshotBuffer() override {
        return service_.buffer.empty() ? std::span<const std::byte>{} : service_.buffer;
      }
      FakeStackshot& service_;
    };
    if (!exists) return nullptr;
    return std::make_unique<Config>(*this);
  }
};

struct FakePurgeableSpace final : PurgeableSpace {
  bool available = true;
  KvRef<KvDictionary> answer;
  std::string asked;

  bool isAvailable() override { return available; }
  KvRef<KvDictionary> copyItemizedPurgeableSpace(const KvDictionary& options) override {
    asked = kvText(options.get("RECLAIM_VOLUME"));
    return answer;
  }
};

struct FakeAnalyticsEvents final : AnalyticsEvents {
  bool available = true;
  std::set<std::string, std::less<>> unwanted;
  std::vector<std::string> offered;
  std::map<std::string, KvRef<KvDictionary>, std::less<>> sent;  // payloads

  bool isAvailable() override { return available; }
  bool isEventWanted(std::string_view eventName) override { return !unwanted.contains(eventName); }
  bool PulseSendEventLazy(std::string_view eventName, const PayloadBuilder& builder) override {
    offered.emplace_back(eventName);
    if (isEventWanted(eventName)) sent[offered.back()] = builder();
    return isEventWanted(eventName);
  }
};

// The fakes in force, and what goes to standard error.
struct FakeStorage {
  explicit FakeStorage(
      std::shared_ptr<FakeStorageRegistry> drivers = std::make_shared<FakeStorageRegistry>())
      : registry(std::move(drivers)) {}

  FakePlatform platform = makeFakePlatform();
  std::shared_ptr<FakeStorageRegistry> registry;
  std::shared_ptr<FakeStackshot> stackshot = std::make_shared<FakeStackshot>();
  std::shared_ptr<FakePurgeableSpace> purgeableSpace = std::make_shared<FakePurgeableSpace>();
  std::shared_ptr<FakeAnalyticsEvents> analyticsEvents = std::make_shared<FakeAnalyticsEvents>();

  Platform services() const {
    Platform all = platform.services();
    all.deviceRegistry = registry;
    all.stackshot = stackshot;
    all.purgeableSpace = purgeableSpace;
    all.analyticsEvents = analyticsEvents;
    return all;
  }
  PlatformScope scope{services()};
};

}  // namespace tally::fakes
