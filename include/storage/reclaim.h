// The purgeable space of the storage. Every call measures afresh.
#pragma once

#include <string_view>

#include "kv/value.h"

namespace tally {

// A failure is a pair of entries, as in nand_info.h: the string "1", and what failed.
constexpr std::string_view kNANDInfoReclaimTotalPurgeableKey =
    "vellum.NANDInfo.Reclaim.TotalPurgeableBytes";  // as the service delivers it
constexpr std::string_view kNANDInfoReclaimTotalNonPurgeableKey =
    "vellum.NANDInfo.Reclaim.TotalNonPurgeableBytes";
constexpr std::string_view kNANDInfoReclaimErrorKey = "vellum.NANDInfo.Reclaim.Error";
constexpr std::string_view kNANDInfoReclaimErrorMessageKey = "vellum.NANDInfo.Reclaim.ErrorMessage";

// The purgeable and the non-purgeable space, or the failure pair. Never null.
TALLY_API KvRef<KvDictionary> CopyReclaimNANDInfo();
// Adds what is known of them. True only when both figures are.
TALLY_API bool addReclaimFigures(KvDictionary& dictionary);

}  // namespace tally
