// The known kinds of storage controller, and the connection to their driver.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

#include "kv/value.h"
#include "storage/statistics.h"

namespace tally {

// A pair of statistic selectors: the first goes with the size query, the second with the data
// call. kSelectorUnavailable first: the driver has no such data.
using SelectorGetter = const std::uint32_t* (*)();
constexpr std::uint32_t kSelectorUnavailable = 0xFFFFFFFF;

// One kind of controller. It cannot export the data whose getter is null.
struct NandExporter {
  const char* className;           // the driver's class; null in the terminator
  const char* characteristicsKey;  // the registry property with the controller's characteristics
  std::int32_t contentDeletionMethod;  // -1: the controller has no such query
  std::uint32_t sizeMethod;
  std::uint32_t dataMethod;
  SelectorGetter statsSelectors;
  SelectorGetter defectsListSelectors;
  SelectorGetter telemetryListSelectors;
  SelectorGetter taskSchedulerSelectors;
  SelectorGetter snapshotSelectors;
  SelectorGetter snapshotHeaderSelectors;
  SelectorGetter bandStatsSelectors;
  void (*reserved[2])();
  int (*parseBuffer)(SPXParseContext* context, const void* buffer, std::size_t length);
  void (*releaseContext)(SPXParseContext* context);
};

// In the order in which they are looked for; the last one is the terminator, all zero.
TALLY_API extern const std::array<NandExporter, 3> nand_exporters;

TALLY_API const std::uint32_t* SPXGetStatsSelectors();
TALLY_API const std::uint32_t* SPXGetDefectsListSelectors();
TALLY_API const std::uint32_t* SPXGetTelemetryListSelectors();
TALLY_API const std::uint32_t* SPXGetTaskSchedulerSelectors();
TALLY_API const std::uint32_t* SPXGetSnapshotSelectors();
TALLY_API const std::uint32_t* SPXGetSnapshotHeaderSelectors();
TALLY_API const std::uint32_t* SPXGetBandStatsSelectors();

// Handles of the device registry: release a service with HandleRelease, a connection with
// FNDDisconnect; 0 is none. Every failure below is one line on standard error. Any thread may call;
// a connection is used by one at a time.

// The service of the first exporter whose driver the device has, or 0. *exporterOut always points
// into nand_exporters afterwards: at the terminator when there is none.
TALLY_API std::uint32_t findNandExporter(const NandExporter** exporterOut);

// Opens a connection to that driver; 0 on failure.
TALLY_API std::uint32_t FNDConnect(const NandExporter** exporterOut);
TALLY_API void FNDDisconnect(std::uint32_t connection);

// An open connection, owned by the caller.
struct SPXConnection {
  std::uint32_t service = 0;
  std::uint32_t connection = 0;
  const NandExporter* exporter = nullptr;
};

// 1 on success; 0 when there is no driver, no connection, or no statistics. *connection is then
// closed.
TALLY_API int openSPXConnection(SPXConnection* connection);
// Releases what is open and sets it to 0.
TALLY_API void closeSPXConnection(SPXConnection* connection);

// Fetches the driver's statistics and hands them to the exporter's parser. *context must be empty
// at the call. On true the caller passes it to the exporter's releaseContext, if there is one; on
// false it is empty.
TALLY_API KvRef<KvBoolean> loadNandStatistics(const NandExporter** exporterOut,
                                              SPXParseContext* context);

// Whether the driver recommends to delete content. False also when it cannot be asked.
TALLY_API KvRef<KvBoolean> NandRecommendsContentDeletion();

}  // namespace tally
