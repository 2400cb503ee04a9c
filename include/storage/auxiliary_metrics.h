// Storage figures beside the driver's statistics: the memory freezer's writes, purgeable space, and
// the health summary with its extracts. Every call measures afresh.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Failures, here as in nand_info.h, are a pair: the string "1", and what failed.
constexpr std::string_view kNANDInfoVMFreezerNumPhysicalWritesKey =
    "vellum.NANDInfo.VMFreezer.NumPhysicalWrites";  // bytes, signed 64-bit
constexpr std::string_view kNANDInfoVMFreezerErrorKey = "vellum.NANDInfo.VMFreezer.Error";
constexpr std::string_view kNANDInfoVMFreezerErrorMessageKey =
    "vellum.NANDInfo.VMFreezer.ErrorMessage";

constexpr std::string_view kNANDInfoReclaimTotalPurgeableKey =
    "vellum.NANDInfo.Reclaim.TotalPurgeableBytes";  // as the service delivers it
constexpr std::string_view kNANDInfoReclaimTotalNonPurgeableKey =
    "vellum.NANDInfo.Reclaim.TotalNonPurgeableBytes";
constexpr std::string_view kNANDInfoReclaimErrorKey = "vellum.NANDInfo.Reclaim.Error";
constexpr std::string_view kNANDInfoReclaimErrorMessageKey = "vellum.NANDInfo.Reclaim.ErrorMessage";

// All signed 32-bit.
constexpr std::string_view kNANDInfoHealthMaxPercentageNANDUsedKey =
    "vellum.NANDInfo.Health.MaxPercentageNANDUsed";
constexpr std::string_view kNANDInfoHealthMaxE2EErrorsKey = "vellum.NANDInfo.Health.MaxE2EErrors";
constexpr std::string_view kNANDInfoHealthHostReadErrorsKey =
    "vellum.NANDInfo.Health.HostReadErrors";
constexpr std::string_view kNANDInfoHealthIsNANDRefurbishableKey =
    "vellum.NANDInfo.Health.IsNANDRefurbishable";
constexpr std::string_view kNANDInfoHealthIsNANDRetirableKey =
    "vellum.NANDInfo.Health.IsNANDRetirable";

// The bytes that the memory freezer wrote, or its failure pair. Never null.
TALLY_API KvRef<KvDictionary> CopyVMFreezerNANDInfo();
// The same figure from a stackshot that is taken now. False leaves *result alone.
TALLY_API bool measureFreezerWrites(std::uint64_t* result);

// Searches kcdata for the first container with a thread of that name. 1 with its I/O statistics
// (no bytes, null, when it has none), or 0. Nothing outside [begin, end) is read; containers nested
// deeper than any thread's are not followed and end the search.
TALLY_API int getIOStatsWithThreadnameFromKCData(const std::byte* begin, const std::byte* end,
                                                 const char* threadName,
                                                 std::span<const std::byte>* ioStatsOut);
// The same in the first container alone, whatever is nested in it included. *positionOut, when
// given, is where the search stopped; null when the data ended first.
TALLY_API int getIOStatsWithThreadnameFromKCDataHelper(const std::byte* begin, const std::byte* end,
                                                       const char* threadName,
                                                       std::span<const std::byte>* ioStatsOut,
                                                       const std::byte** positionOut);

// The purgeable and the non-purgeable space, or the failure pair. Never null.
TALLY_API KvRef<KvDictionary> CopyReclaimNANDInfo();
// Adds what is known of them. True only when both figures are.
TALLY_API bool addReclaimFigures(KvDictionary& dictionary);

// The wear, end-to-end and host-read counters with the largest of each group; the extracts of it
// for the repair service, the internal lab and the over-the-air update. A counter that the driver
// does not export is 0. One that is no number is 0 too, and the error key is the number 1.
TALLY_API KvRef<KvDictionary> CopyNANDHealthInfo();
TALLY_API KvRef<KvDictionary> CopyFixlineNANDInfo();
TALLY_API KvRef<KvDictionary> CopyInternalLabNANDInfo();
TALLY_API KvRef<KvDictionary> CopyOTANANDInfo();

}  // namespace tally
