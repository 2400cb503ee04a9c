// The NAND info dictionary: the flash storage's figures, by report key. Any thread may ask for one.
#pragma once

#include <array>
#include <cstdint>
#include <string_view>

#include "kv/value.h"
#include "storage/statistics.h"

namespace tally {

// A dictionary that reports a failure has these two entries: the string "1", and what failed.
constexpr std::string_view kNANDInfoErrorKey = "vellum.NANDInfo.Error";
constexpr std::string_view kNANDInfoErrorMessageKey = "vellum.NANDInfo.ErrorMessage";
constexpr std::string_view kNANDInfoTlydPlaceholder = "tlyd.key.placeholder";

// Numbers; signed 64-bit unless noted otherwise.
constexpr std::string_view kNANDInfoExportVersionKey = "vellum.NANDInfo.ExportVersion";  // 32-bit
constexpr std::string_view kNANDInfoDriverVersionKey = "vellum.NANDInfo.DriverVersion";  // 32-bit
constexpr std::string_view kNANDInfoDemoModeKey = "vellum.NANDInfo.DemoMode";
constexpr std::string_view kNANDInfoNumVirtualBlocksKey =
    "vellum.NANDInfo.NumVirtualBlocks";  // 32-bit
constexpr std::string_view kNANDInfoPagesPerVirtualBlockKey =
    "vellum.NANDInfo.PagesPerVirtualBlock";                                            // 32-bit
constexpr std::string_view kNANDInfoBytesPerPageKey = "vellum.NANDInfo.BytesPerPage";  // 32-bit
constexpr std::string_view kNANDInfoNumLogicalReadsKey = "vellum.NANDInfo.NumLogicalReads";
constexpr std::string_view kNANDInfoNumLogicalWritesKey = "vellum.NANDInfo.NumLogicalWrites";
constexpr std::string_view kNANDInfoNumFreeVirtualBlocksKey =
    "vellum.NANDInfo.NumFreeVirtualBlocks";
constexpr std::string_view kNANDInfoNumWearLevelOpsKey = "vellum.NANDInfo.NumWearLevelOps";
constexpr std::string_view kNANDInfoNumPhysicalReadsKey = "vellum.NANDInfo.NumPhysicalReads";
constexpr std::string_view kNANDInfoNumPhysicalWritesKey = "vellum.NANDInfo.NumPhysicalWrites";
constexpr std::string_view kNANDInfoNumPhysicalErasesKey = "vellum.NANDInfo.NumPhysicalErases";
constexpr std::string_view kNANDInfoNumNodesFreeKey = "vellum.NANDInfo.NodesFree";
constexpr std::string_view kNANDInfoNumNodesTotalKey = "vellum.NANDInfo.NodesTotal";
// Whole weeks, despite the key's name, on which reports rely.
constexpr std::string_view kNANDInfoFormatWeeksSince2000Key = "vellum.NANDInfo.formatDaysSince2000";
constexpr std::string_view kNANDInfoNumSleepOpsKey = "vellum.NANDInfo.NumSleepOps";
constexpr std::string_view kNANDInfoHighEnduranceBlockEraseCountKey =
    "vellum.NANDInfo.HighEnduranceBlockEraseCount";
constexpr std::string_view kNANDInfoBlocksPerVirtualBlock =
    "vellum.NANDInfo.BlocksPerVirtualBlock";  // 32-bit
constexpr std::string_view kNANDInfoIntermediatePartitionSizeKey =
    "vellum.NANDInfo.IntermediatePartitionSize";
constexpr std::string_view kNANDInfoNumMaintenanceRequestsKey =
    "vellum.NANDInfo.NumMaintenanceRequests";
constexpr std::string_view kNANDInfoMaintenanceFailedReadKey =
    "vellum.NANDInfo.MaintenanceRequestsFailedRead";
constexpr std::string_view kNANDInfoMaintenanceFailedProgKey =
    "vellum.NANDInfo.MaintenanceRequestsFailedProg";
constexpr std::string_view kNANDInfoMaintenanceFailedEraseKey =
    "vellum.NANDInfo.MaintenanceRequestsFailedErase";
constexpr std::array<std::string_view, 5> kNANDInfoReadsBeforeErasureKeys{
    "vellum.NANDInfo.ReadsBeforeErasure0", "vellum.NANDInfo.ReadsBeforeErasure50000",
    "vellum.NANDInfo.ReadsBeforeErasure100000", "vellum.NANDInfo.ReadsBeforeErasure150000",
    "vellum.NANDInfo.ReadsBeforeErasure200000"};

constexpr std::int32_t kOne = 1;
constexpr std::int32_t kMinusOne = -1;
constexpr std::int32_t kZero = 0;

// The write amplification last measured; 0 until the structured-log dump measures it.
TALLY_API extern double gCurrentUserWamp;
TALLY_API extern double gCurrentSysWamp;

// A fresh fetch, with the purgeable space added. Never null; a failure is in the dictionary: the
// pair above, or the pair of the purgeable space (reclaim.h), which leaves the rest.
TALLY_API KvRef<KvDictionary> CopyNANDInfo();

// On every other day of a boot session the figures belong to the analytics service: with this bit
// they are sent there, without it the result is null on that day. On the days between it is
// CopyNANDInfo's result.
constexpr std::uint32_t kNANDInfoAnalyticsOption = 1;
TALLY_API KvRef<KvDictionary> CopyNANDInfoWithOptions(std::uint32_t options);

// The dictionary of a parsed context; for a dump without versions and demo mode. With an export
// version of 0 the failure pair, and null for a dump.
TALLY_API KvRef<KvDictionary> buildNandInfo(const SPXParseContext& context, bool forDump);

// The value, or a new number 0 (a string "empty") when the key is absent.
TALLY_API KvRef<KvObject> GetNumberFromDictionarySafe(const KvDictionary& dictionary,
                                                      std::string_view key);
TALLY_API KvRef<KvObject> GetStringFromDictionarySafe(const KvDictionary& dictionary,
                                                      std::string_view key);

// Stores the number that valuePointer points to, of the given type. No number can be made of
// another type or of a null pointer; then a line on standard error says so and nothing is stored.
enum class NumberType { SInt32, SInt64 };
TALLY_API void setNumberInDictionary(KvDictionary& dictionary, std::string_view key,
                                     const void* valuePointer, NumberType numberType);

}  // namespace tally
