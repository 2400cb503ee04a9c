// The device registry: entries that drivers publish, and connections to their user clients.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// 0 is success; any other result is the platform's code.
using RegistryResult = std::uint32_t;

// Handles of entries, iterators and connections; 0 is none. An operation that hands one out has
// retained it for the caller, who releases it with HandleRelease (a connection: with
// ServiceCloseConnection). An operation on a handle that is not in use fails, it never crashes.
using RegistryHandle = std::uint32_t;
using ConnectionHandle = std::uint32_t;

// Keys of a matching dictionary; an entry must satisfy all that are present, an unknown key
// matches nothing.
constexpr std::string_view kMatchClass = "HwProviderClass";     // string: the entry's class
constexpr std::string_view kMatchName = "HwNameMatch";          // string: the entry's name
constexpr std::string_view kMatchEntryID = "HwEntryIDMatch";    // number: the entry's id
constexpr std::string_view kMatchProperty = "HwPropertyMatch";  // dictionary: property to value;
                                                                // true matches any value

// What a method call passes in, and where its results go.
struct MethodCall {
  std::span<const std::uint64_t> scalarInput = {};
  std::span<const std::byte> structInput = {};
  std::span<std::uint64_t> scalarOutput = {};  // capacity for results
  std::size_t scalarOutputCount = 0;           // how many were written
  std::span<std::byte> structOutput = {};      // capacity for results
  std::size_t structOutputSize = 0;            // how many bytes were written
};

class DeviceRegistry {
 public:
  virtual ~DeviceRegistry() = default;

  // The first matching entry, or 0. Takes over the reference to the dictionary.
  virtual RegistryHandle RegistryFindService(KvRef<KvDictionary> matching) = 0;
  // An iterator over the matching entries. Takes over the reference to the dictionary.
  virtual RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary> matching,
                                                      RegistryHandle* iterator) = 0;
  // The next entry, or 0 at the end.
  virtual RegistryHandle RegistryIteratorNext(RegistryHandle iterator) = 0;
  // False once the registry changed under the iterator.
  virtual bool RegistryIteratorIsValid(RegistryHandle iterator) = 0;

  // Null when the entry has no such property.
  virtual KvRef<KvObject> RegistryCopyProperty(RegistryHandle entry, std::string_view key) = 0;
  // The property of the entry, or of the nearest of its parents that has it.
  virtual KvRef<KvObject> RegistrySearchProperty(RegistryHandle entry, std::string_view key) = 0;
  virtual RegistryResult RegistryGetEntryID(RegistryHandle entry, std::uint64_t* id) = 0;
  virtual RegistryResult RegistryGetName(RegistryHandle entry, std::string* name) = 0;
  // The handle's retain count; 0 when it is not in use.
  virtual std::uint32_t RegistryHandleIsValid(RegistryHandle handle) = 0;
  virtual void HandleRetain(RegistryHandle handle) = 0;
  virtual void HandleRelease(RegistryHandle handle) = 0;

  // Opens a user client of a type; *connection is 0 on failure. The connection outlives the
  // service's handle.
  virtual RegistryResult ServiceOpenConnection(RegistryHandle service, std::uint32_t type,
                                               ConnectionHandle* connection) = 0;
  virtual RegistryResult ServiceCloseConnection(ConnectionHandle connection) = 0;
  virtual RegistryResult ConnectionCallMethod(ConnectionHandle connection, std::uint32_t selector,
                                              MethodCall& call) = 0;
  // Maps the client's memory of a type; it stays until it is unmapped or the connection is closed.
  virtual RegistryResult ConnectionMapMemory(ConnectionHandle connection, std::uint32_t memoryType,
                                             std::uint32_t options, const std::byte** address,
                                             std::size_t* length) = 0;
  virtual RegistryResult ConnectionUnmapMemory(ConnectionHandle connection,
                                               std::uint32_t memoryType,
                                               const std::byte* address) = 0;
};

// Options of ConnectionMapMemory: at any free address.
constexpr std::uint32_t kMapAnywhere = 1;

// The matching dictionary of a class.
inline KvRef<KvDictionary> ServiceMatchingByClass(std::string_view className) {
  return KvDictionary::create({{kMatchClass, KvString::create(className)}});
}

}  // namespace tally
