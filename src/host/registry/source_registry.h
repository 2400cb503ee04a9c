// The registry over one or more sources of entries: handles, matching, iterators, connections.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <variant>
#include <vector>

#include "host/registry/registry_source.h"

namespace tally {

// Any thread may call. A connection's calls do not wait for those of another.
class SourceRegistry final : public DeviceRegistry {
 public:
  // Entries of earlier sources come first in every enumeration.
  explicit SourceRegistry(std::vector<std::unique_ptr<RegistrySource>> sources)
      : sources_(std::move(sources)) {}

  RegistryHandle RegistryFindService(KvRef<KvDictionary> matching) override;
  RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary> matching,
                                              RegistryHandle* iterator) override;
  RegistryHandle RegistryIteratorNext(RegistryHandle iterator) override;
  bool RegistryIteratorIsValid(RegistryHandle iterator) override;
  KvRef<KvObject> RegistryCopyProperty(RegistryHandle entry, std::string_view key) override;
  KvRef<KvObject> RegistrySearchProperty(RegistryHandle entry, std::string_view key) override;
  RegistryResult RegistryGetEntryID(RegistryHandle entry, std::uint64_t* id) override;
  RegistryResult RegistryGetName(RegistryHandle entry, std::string* name) override;
  std::uint32_t RegistryHandleIsValid(RegistryHandle handle) override;
  void HandleRetain(RegistryHandle handle) override;
  void HandleRelease(RegistryHandle handle) override;
  RegistryResult ServiceOpenConnection(RegistryHandle service, std::uint32_t type,
                                       ConnectionHandle* connection) override;
  RegistryResult ServiceCloseConnection(ConnectionHandle connection) override;
  RegistryResult ConnectionCallMethod(ConnectionHandle connection, std::uint32_t selector,
                                      MethodCall& call) override;
  RegistryResult ConnectionMapMemory(ConnectionHandle connection, std::uint32_t memoryType,
                                     std::uint32_t options, const std::byte** address,
                                     std::size_t* length) override;
  RegistryResult ConnectionUnmapMemory(ConnectionHandle connection, std::uint32_t memoryType,
                                       const std::byte* address) override;
  // Handles and connections in use, so that leaks show.
  std::size_t openHandles() const {
    const std::lock_guard lock(mutex_);
    return handles_.size() + connections_.size();
  }

 private:
  using Entry = std::shared_ptr<const RegistryEntry>;
  using Lists = std::vector<std::shared_ptr<const RegistrySource::Entries>>;
  struct Place {
    Entry entry;
    std::size_t source;
  };
  struct Iterator {
    Lists seen;  // the sources' lists when the iterator was made
    std::vector<Place> matches;
    std::size_t next = 0;
  };
  struct Slot {
    std::uint32_t retainCount = 1;
    std::variant<Place, Iterator> object;
  };

  Lists currentLists();
  std::vector<Place> matchingEntries(const Lists& lists, const KvDictionary* matching);
  RegistryHandle add(std::variant<Place, Iterator> object);
  const Place* entryOf(RegistryHandle handle) const;
  Iterator* iteratorOf(RegistryHandle handle);
  std::shared_ptr<UserClient> clientOf(ConnectionHandle connection) const;

  mutable std::mutex mutex_;  // of all below, and of the sources
  std::vector<std::unique_ptr<RegistrySource>> sources_;
  // Handles are never reused, so that a released one stays invalid.
  RegistryHandle nextHandle_ = 0x1000;
  std::map<RegistryHandle, Slot> handles_;
  std::map<ConnectionHandle, std::shared_ptr<UserClient>> connections_;
};

}  // namespace tally
