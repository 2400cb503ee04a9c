// A device registry in memory whose every operation can be made to fail.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "platform/device_registry.h"

namespace tally::fakes {

struct FakeRegistry final : DeviceRegistry {
  struct Entry {
    std::string className, name;
    std::uint64_t id = 0;
    KvRef<KvDictionary> properties = KvDictionary::create();
    RegistryResult nameResult = 0, idResult = 0;
  };
  std::vector<Entry> entries;
  bool changesDuringWalk = false;
  RegistryResult matchResult = 0, openResult = 0, mapResult = 0;
  std::map<std::uint32_t, RegistryResult> callResults;  // by selector
  std::uint64_t token = 0x1'0000'0007;
  std::size_t tokensWritten = 1;
  std::vector<std::byte> region;     // mapped
  std::vector<std::byte> structure;  // the last structure input
  std::vector<std::uint64_t> scalars;
  std::vector<std::string> calls;  // operations on connections, in order
  std::map<RegistryHandle, int> handles;
  KvRef<KvDictionary> matched;  // the last matching dictionary

  int openHandles() const {
    int sum = 0;
    for (const auto& [handle, count] : handles) sum += count;
    return sum;
  }
  // A handle of an entry, for the caller to release.
  RegistryHandle handleOf(std::size_t index) { return retained(kFirst + index); }

  RegistryHandle RegistryFindService(KvRef<KvDictionary> matching) override {
    for (std::size_t i = 0; i < entries.size(); ++i) {
      if (matching->getString(kMatchClass) == entries[i].className) return handleOf(i);
    }
    return 0;
  }
  RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary> matching,
                                              RegistryHandle* iterator) override {
    matched = matching;
    if (matchResult != 0) return matchResult;
    next_ = 0;
    *iterator = retained(kIterator);
    return 0;
  }
  RegistryHandle RegistryIteratorNext(RegistryHandle) override {
    for (; next_ < entries.size(); ++next_) {
      if (matches(entries[next_])) return handleOf(next_++);
    }
    return 0;
  }
  bool RegistryIteratorIsValid(RegistryHandle) override { return !changesDuringWalk; }
  KvRef<KvObject> RegistryCopyProperty(RegistryHandle entry, std::string_view key) override {
    return KvRef<KvObject>::share(entries[entry - kFirst].properties->get(key));
  }
  KvRef<KvObject> RegistrySearchProperty(RegistryHandle entry, std::string_view key) override {
    return RegistryCopyProperty(entry, key);
  }
  RegistryResult RegistryGetEntryID(RegistryHandle entry, std::uint64_t* id) override {
    *id = entries[entry - kFirst].id;
    return entries[entry - kFirst].idResult;
  }
  RegistryResult RegistryGetName(RegistryHandle entry, std::string* name) override {
    *name = entries[entry - kFirst].name;
    return entries[entry - kFirst].nameResult;
  }
  std::uint32_t RegistryHandleIsValid(RegistryHandle handle) override {
    return static_cast<std::uint32_t>(handles[handle]);
  }
  void HandleRetain(RegistryHandle handle) override { ++handles[handle]; }
  void HandleRelease(RegistryHandle handle) override { --handles[handle]; }

  RegistryResult ServiceOpenConnection(RegistryHandle, std::uint32_t type,
                                       ConnectionHandle* connection) override {
    calls.push_back("open " + std::to_string(type));
    *connection = openResult == 0 ? kConnection : 0;
    return openResult;
  }
  RegistryResult ServiceCloseConnection(ConnectionHandle) override {
    calls.push_back("close");
    return 0;
  }
  RegistryResult ConnectionCallMethod(ConnectionHandle, std::uint32_t selector,
                                      MethodCall& call) override {
    calls.push_back("call " + std::to_string(selector));
    if (!call.structInput.empty()) {
      structure.assign(call.structInput.begin(), call.structInput.end());
    }
    scalars.assign(call.scalarInput.begin(), call.scalarInput.end());
    if (!call.scalarOutput.empty() && tokensWritten != 0) {
      call.scalarOutput[0] = token;
      call.scalarOutputCount = tokensWritten;
    }
    return callResults[selector];
  }
  RegistryResult ConnectionMapMemory(ConnectionHandle, std::uint32_t type, std::uint32_t options,
                                     const std::byte** address, std::size_t* length) override {
    calls.push_back("map " + std::to_string(type) + " " + std::to_string(options));
    *address = region.data();
    *length = region.size();
    return mapResult;
  }
  RegistryResult ConnectionUnmapMemory(ConnectionHandle, std::uint32_t type,
                                       const std::byte* address) override {
    calls.push_back("unmap " + std::to_string(type) + (address == region.data() ? "" : " wrong"));
    return 0;
  }

 private:
  static constexpr RegistryHandle kIterator = 1, kConnection = 2, kFirst = 16;
  // Only the property part of a matching dictionary, where true matches any value.
  bool matches(const Entry& entry) const {
    const auto* wanted = matched->getAs<KvDictionary>(kMatchProperty);
    if (wanted == nullptr) return true;
    for (const auto& [key, value] : *wanted) {
      if (!entry.properties->contains(key->view())) return false;
    }
    return true;
  }
  RegistryHandle retained(std::size_t handle) {
    ++handles[static_cast<RegistryHandle>(handle)];
    return static_cast<RegistryHandle>(handle);
  }
  std::size_t next_ = 0;
};

}  // namespace tally::fakes
