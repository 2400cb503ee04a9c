// The health summary of the storage and its extracts. Every call measures afresh.
#pragma once

#include <string_view>

#include "kv/value.h"

namespace tally {

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

// The wear, end-to-end and host-read counters with the largest of each group; the extracts of it
// for the repair service, the internal lab and the over-the-air update. A counter that the driver
// does not export is 0. One that is not a number is 0 too, and the error key is the number 1.
TALLY_API KvRef<KvDictionary> CopyNANDHealthInfo();
TALLY_API KvRef<KvDictionary> CopyFixlineNANDInfo();
TALLY_API KvRef<KvDictionary> CopyInternalLabNANDInfo();
TALLY_API KvRef<KvDictionary> CopyOTANANDInfo();

}  // namespace tally
