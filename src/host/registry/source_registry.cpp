#include "host/registry/source_registry.h"

#include <deque>
#include <set>

#include "host/registry/matching.h"

namespace tally {

SourceRegistry::Lists SourceRegistry::currentLists() {
  Lists lists;
  for (const auto& source : sources_) lists.push_back(source->entries());
  return lists;
}

std::vector<SourceRegistry::Place> SourceRegistry::matchingEntries(const Lists& lists,
                                                                   const KvDictionary* matching) {
  std::vector<Place> matches;
  if (matching == nullptr) return matches;
  for (std::size_t source = 0; source < lists.size(); ++source) {
    for (const Entry& entry : *lists[source]) {
      if (entryMatches(*entry, *matching)) matches.push_back({entry, source});
    }
  }
  return matches;
}

RegistryHandle SourceRegistry::add(std::variant<Place, Iterator> object) {
  handles_.emplace(++nextHandle_, Slot{1, std::move(object)});
  return nextHandle_;
}

const SourceRegistry::Place* SourceRegistry::entryOf(RegistryHandle handle) const {
  const auto slot = handles_.find(handle);
  return slot != handles_.end() ? std::get_if<Place>(&slot->second.object) : nullptr;
}

SourceRegistry::Iterator* SourceRegistry::iteratorOf(RegistryHandle handle) {
  const auto slot = handles_.find(handle);
  return slot != handles_.end() ? std::get_if<Iterator>(&slot->second.object) : nullptr;
}

std::shared_ptr<UserClient> SourceRegistry::clientOf(ConnectionHandle connection) const {
  const std::lock_guard lock(mutex_);
  const auto client = connections_.find(connection);
  return client != connections_.end() ? client->second : nullptr;
}

RegistryHandle SourceRegistry::RegistryFindService(KvRef<KvDictionary> matching) {
  const std::lock_guard lock(mutex_);
  auto matches = matchingEntries(currentLists(), matching.get());
  return matches.empty() ? 0 : add(std::move(matches.front()));
}

RegistryResult SourceRegistry::RegistryCopyMatchingServices(KvRef<KvDictionary> matching,
                                                            RegistryHandle* iterator) {
  const std::lock_guard lock(mutex_);
  *iterator = 0;
  if (!matching) return kRegistryBadArgument;
  Lists lists = currentLists();
  auto matches = matchingEntries(lists, matching.get());
  *iterator = add(Iterator{std::move(lists), std::move(matches)});
  return kRegistrySuccess;
}

RegistryHandle SourceRegistry::RegistryIteratorNext(RegistryHandle iterator) {
  const std::lock_guard lock(mutex_);
  Iterator* const place = iteratorOf(iterator);
  if (place == nullptr || place->next >= place->matches.size()) return 0;
  return add(place->matches[place->next++]);
}

bool SourceRegistry::RegistryIteratorIsValid(RegistryHandle iterator) {
  const std::lock_guard lock(mutex_);
  const Iterator* const place = iteratorOf(iterator);
  return place != nullptr && place->seen == currentLists();
}

KvRef<KvObject> SourceRegistry::RegistryCopyProperty(RegistryHandle entry, std::string_view key) {
  const std::lock_guard lock(mutex_);
  const Place* const place = entryOf(entry);
  if (place == nullptr) return nullptr;
  return KvRef<KvObject>::share(place->entry->properties->get(key));
}

KvRef<KvObject> SourceRegistry::RegistrySearchProperty(RegistryHandle entry, std::string_view key) {
  const std::lock_guard lock(mutex_);
  const Place* const place = entryOf(entry);
  if (place == nullptr) return nullptr;
  const auto entries = sources_[place->source]->entries();
  // Nearest first; a description may name an entry as its own ancestor.
  std::deque<Entry> pending{place->entry};
  std::set<std::uint64_t> seen{place->entry->id};
  while (!pending.empty()) {
    const Entry current = std::move(pending.front());
    pending.pop_front();
    if (KvObject* value = current->properties->get(key)) return KvRef<KvObject>::share(value);
    for (const std::uint64_t parent : current->parents) {
      if (!seen.insert(parent).second) continue;
      for (const Entry& candidate : *entries) {
        if (candidate->id == parent) pending.push_back(candidate);
      }
    }
  }
  return nullptr;
}

RegistryResult SourceRegistry::RegistryGetEntryID(RegistryHandle entry, std::uint64_t* id) {
  const std::lock_guard lock(mutex_);
  const Place* const place = entryOf(entry);
  if (place == nullptr) return kRegistryBadArgument;
  *id = place->entry->id;
  return kRegistrySuccess;
}

RegistryResult SourceRegistry::RegistryGetName(RegistryHandle entry, std::string* name) {
  const std::lock_guard lock(mutex_);
  const Place* const place = entryOf(entry);
  if (place == nullptr) return kRegistryBadArgument;
  *name = place->entry->name;
  return kRegistrySuccess;
}

std::uint32_t SourceRegistry::RegistryHandleIsValid(RegistryHandle handle) {
  const std::lock_guard lock(mutex_);
  const auto slot = handles_.find(handle);
  return slot != handles_.end() ? slot->second.retainCount : 0;
}

void SourceRegistry::HandleRetain(RegistryHandle handle) {
  const std::lock_guard lock(mutex_);
  const auto slot = handles_.find(handle);
  if (slot != handles_.end()) ++slot->second.retainCount;
}

void SourceRegistry::HandleRelease(RegistryHandle handle) {
  const std::lock_guard lock(mutex_);
  const auto slot = handles_.find(handle);
  if (slot != handles_.end() && --slot->second.retainCount == 0) handles_.erase(slot);
}

RegistryResult SourceRegistry::ServiceOpenConnection(RegistryHandle service, std::uint32_t type,
                                                     ConnectionHandle* connection) {
  const std::lock_guard lock(mutex_);
  *connection = 0;
  const Place* const place = entryOf(service);
  if (place == nullptr) return kRegistryBadArgument;
  RegistryResult result = kRegistryUnsupported;
  auto client = sources_[place->source]->open(*place->entry, type, &result);
  if (!client) return result != kRegistrySuccess ? result : kRegistryUnsupported;
  connections_.emplace(++nextHandle_, std::move(client));
  *connection = nextHandle_;
  return kRegistrySuccess;
}

RegistryResult SourceRegistry::ServiceCloseConnection(ConnectionHandle connection) {
  const std::lock_guard lock(mutex_);
  const auto client = connections_.find(connection);
  if (client == connections_.end()) return kRegistryBadArgument;
  const RegistryResult result = client->second->close();
  connections_.erase(client);
  return result;
}

RegistryResult SourceRegistry::ConnectionCallMethod(ConnectionHandle connection,
                                                    std::uint32_t selector, MethodCall& call) {
  call.scalarOutputCount = 0;
  call.structOutputSize = 0;
  const auto client = clientOf(connection);
  return client != nullptr ? client->call(selector, call) : kRegistryBadArgument;
}

RegistryResult SourceRegistry::ConnectionMapMemory(ConnectionHandle connection,
                                                   std::uint32_t memoryType, std::uint32_t options,
                                                   const std::byte** address, std::size_t* length) {
  *address = nullptr;
  *length = 0;
  const auto client = clientOf(connection);
  if (client == nullptr || options != kMapAnywhere) return kRegistryBadArgument;
  std::span<const std::byte> memory;
  const RegistryResult result = client->map(memoryType, &memory);
  if (result != kRegistrySuccess) return result;
  *address = memory.data();
  *length = memory.size();
  return kRegistrySuccess;
}

RegistryResult SourceRegistry::ConnectionUnmapMemory(ConnectionHandle connection,
                                                     std::uint32_t memoryType,
                                                     const std::byte* address) {
  const auto client = clientOf(connection);
  return client != nullptr ? client->unmap(memoryType, address) : kRegistryBadArgument;
}

}  // namespace tally
