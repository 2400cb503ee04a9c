// Calls of the storage driver, and a connection for the length of one query.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

#include "platform/registry_results.h"

namespace tally {

struct StructReply {
  RegistryResult status = kRegistrySuccess;
  std::size_t length = 0;  // bytes written, at most the capacity
};

// A structure in, a structure out: the one shape of the driver's methods.
StructReply callStructMethod(ConnectionHandle connection, std::uint32_t method,
                             std::span<const std::byte> input, std::span<std::byte> output);

// Takes over a service's handle and opens a connection to it; a failure is printed. The destructor
// releases both.
class QueryConnection {
 public:
  explicit QueryConnection(RegistryHandle service);
  ~QueryConnection();
  QueryConnection(const QueryConnection&) = delete;
  QueryConnection& operator=(const QueryConnection&) = delete;
  bool isOpen() const { return open_; }
  ConnectionHandle handle() const { return connection_; }

 private:
  RegistryHandle service_;
  ConnectionHandle connection_ = 0;
  bool open_ = false;
};

}  // namespace tally
