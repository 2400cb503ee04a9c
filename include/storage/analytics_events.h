// The storage figures as analytics events.
#pragma once

#include <array>
#include <cstdint>
#include <string_view>

#include "kv/value.h"

namespace tally {

// The events, in the order in which they are sent.
constexpr std::array<std::string_view, 35> kEventPulseEvents{
    "vellum.massstorage.NANDInfo",
    "vellum.massstorage.NANDInfo_2",
    "vellum.massstorage.NANDInfo_3",
    "vellum.massstorage.NANDInfo_4",
    "vellum.massstorage.NANDInfo.OverWritesPerInternalFlow",
    "vellum.massstorage.NANDInfo.wcacheDSOverWrLogSizeCnts",
    "vellum.massstorage.NANDInfo.wcacheWaitLogMs",
    "vellum.massstorage.NANDInfo.PadSectorsPerHostFlow",
    "vellum.massstorage.NANDInfo.OverWritesPerHostFlow",
    "vellum.massstorage.NANDInfo.BandsMinTempHisto",
    "vellum.massstorage.NANDInfo.BalanceProportionBucketsHistogram",
    "vellum.massstorage.NANDInfo.BandsDeltaTempHisto",
    "vellum.massstorage.NANDInfo.BandsLifeTimeTempHisto",
    "vellum.massstorage.NANDInfo.BandsPerHostFlow",
    "vellum.massstorage.NANDInfo.SectorsPerHostFlow",
    "vellum.massstorage.NANDInfo.wcacheDSOverWrSizeByFlow",
    "vellum.massstorage.NANDInfo.UnmapsPerInternalFlow",
    "vellum.massstorage.NANDInfo.commitPadSectorsPerFlow",
    "vellum.massstorage.NANDInfo.wcacheDS_segsSortedLogSize",
    "vellum.massstorage.NANDInfo.BandsCrossTempHisto",
    "vellum.massstorage.NANDInfo.NumRefreshesTier",
    "vellum.massstorage.NANDInfo.wcacheDirtyAtFlush",
    "vellum.massstorage.NANDInfo.BandsMaxTempHisto",
    "vellum.massstorage.NANDInfo.BurstSizeHistogram",
    "vellum.massstorage.NANDInfo.PadSize",
    "vellum.massstorage.NANDInfo.UnmapsPerHostFlow",
    "vellum.massstorage.NANDInfo.BandsPerInternalFlow",
    "vellum.massstorage.NANDInfo.CacheDepthVsThroughput0",
    "vellum.massstorage.NANDInfo.CacheDepthVsThroughput1",
    "vellum.massstorage.NANDInfo.CacheDepthVsThroughput2",
    "vellum.massstorage.NANDInfo.CacheDepthVsThroughput3",
    "vellum.massstorage.NANDInfo.ClogPagesFillingPercentage",
    "vellum.massstorage.NANDInfo_5",
    "vellum.massstorage.NANDInfo.BootTimes",
    "vellum.massstorage.NANDInfo_6",
};

// A JSON object: by event, an object from each field of its payload to the NAND info key that the
// field carries, or to kNANDInfoTlydPlaceholder for a field that is filled from elsewhere.
TALLY_API extern const std::string_view kEventPulseRefJson;

// Each payload is written to the system log too.
constexpr std::uint32_t kNANDInfoLogPayloadsOption = 2;

// Sends the events. The result is always empty; without an analytics-event service it
// is the failure pair of nand_info.h. A figure that the driver does not export is sent as 0.
TALLY_API KvRef<KvDictionary> LogtoEPNANDInfoWithOptions(std::uint32_t options);

}  // namespace tally
