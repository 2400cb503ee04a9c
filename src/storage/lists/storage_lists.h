// The lists that the storage driver keeps, and how they are fetched.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <string_view>

#include "kv/value.h"
#include "storage/exporter.h"

namespace tally {

// A list as a handler gets it; all of it is borrowed during the call.
struct StorageList {
  std::span<const std::byte> bytes;  // what the data call returned, not what was announced
  const KvObject* characteristics = nullptr;
  std::string_view className;  // of the driver
};
// True when the list could be handled.
using ListHandler = std::function<bool(const StorageList&)>;

// The selectors of a kind of list, and what is printed when the controller has none.
struct ListKind {
  SelectorGetter NandExporter::*selectors;
  const char* unsupported;
};
extern const ListKind kValidityList, kTelemetryList, kDefectsList;

struct ListRequest {
  const ListKind& kind;
  ListHandler handler;
  std::uint32_t mode = 0;
};

// The modes in which telemetry is asked for.
constexpr std::uint32_t kTelemetryModes = 3;

// Finds the driver and hands each list to its handler. True when every one that was handled
// succeeded; each failure is a line on standard error.
bool fetchLists(std::span<const ListRequest> requests, bool requestFlag);

// The same with a driver that is open. The selectors of all requests are looked up first, so that
// lists which the controller cannot export are named before anything is fetched.
bool fetchListsFrom(std::uint32_t connection, const NandExporter& exporter,
                    const KvObject* characteristics, std::span<const ListRequest> requests,
                    bool requestFlag);

}  // namespace tally
