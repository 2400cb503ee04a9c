// The lists that the storage driver keeps, and how they are fetched.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <span>
#include <string_view>

#include "kv/value.h"
#include "storage/exporter.h"
#include "storage/lists/telemetry_list.h"

namespace tally {

// A list as a handler gets it; all of it is borrowed for the length of the call.
struct StorageList {
  std::span<const std::byte> bytes;  // what the data call returned, not what was announced
  const KvObject* characteristics = nullptr;
  std::string_view className;  // of the driver
};
// True when the list could be handled.
using ListHandler = std::function<bool(const StorageList&)>;

// Which selectors a kind of list has, and what is said when the controller has none.
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

// The same at a driver that is open. The selectors of the requests are looked up first, so that
// what the controller cannot give is said before anything is fetched.
bool fetchListsFrom(std::uint32_t connection, const NandExporter& exporter,
                    const KvObject* characteristics, std::span<const ListRequest> requests,
                    bool requestFlag);

// DumpStorageStructuredLog, which names digits that are none on standard output. A program whose
// own output goes there has them elsewhere.
bool dumpStorageLists(bool requestFlag, std::FILE* notices);

// Hand the records of a defects list to the sink: a summary, and each defect. A record that does
// not lie inside the list is left out; then a line says so and the result is false.
bool readDefectsList(const StorageList& list, const RecordSink& sink);

// The values of the records, by list index: "ValidityList[%d]" to an array, for each index from 0
// to 15 that occurs. Null, after a line on standard error, when the list does not hold the records
// that it announces.
KvRef<KvDictionary> readValidityList(std::span<const std::byte> list);

// The storage-status dictionary: the write amplification last measured, the NAND info dictionary,
// and the validity list.
KvRef<KvDictionary> storageStatusOf(const KvDictionary& validity);

}  // namespace tally
