// A source of registry entries. There can be several.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "kv/value.h"
#include "platform/device_registry.h"
#include "platform/registry_results.h"

namespace tally {

struct RegistryEntry {
  std::string className;
  std::string name;
  std::uint64_t id = 0;
  std::vector<std::uint64_t> parents;  // ids, nearest first
  KvRef<KvDictionary> properties;      // never null
};

// An open connection to a driver; closed when it is destroyed.
class UserClient {
 public:
  virtual ~UserClient() = default;
  virtual RegistryResult call(std::uint32_t selector, MethodCall& call) = 0;
  // The memory of a type, which stays where it is until it is unmapped or the client is closed.
  virtual RegistryResult map(std::uint32_t, std::span<const std::byte>*) {
    return kRegistryUnsupported;
  }
  virtual RegistryResult unmap(std::uint32_t, const std::byte*) { return kRegistryUnsupported; }
  virtual RegistryResult close() { return kRegistrySuccess; }
};

class RegistrySource {
 public:
  virtual ~RegistrySource() = default;
  using Entries = std::vector<std::shared_ptr<const RegistryEntry>>;
  // The current entries; the same list as long as nothing has changed.
  virtual std::shared_ptr<const Entries> entries() = 0;
  // Opens a client of one of the entries; null with *result set when the driver refuses.
  virtual std::unique_ptr<UserClient> open(const RegistryEntry& entry, std::uint32_t type,
                                           RegistryResult* result) = 0;
};

}  // namespace tally
