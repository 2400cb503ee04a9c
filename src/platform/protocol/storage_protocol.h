// The protocol of storage drivers beside the fetch request: their classes, methods and selectors,
// and the statistics that a driver of ours exports.
#pragma once

#include <algorithm>
#include <cstdint>
#include <string_view>

namespace tally {

// The class that is looked for first.
constexpr std::string_view kStorageDriverClass = "SPXStorage";
constexpr std::string_view kStorageDriverClasses[] = {kStorageDriverClass,
                                                      "OrreryEmbeddedNVMeController"};
constexpr std::string_view kStorageCharacteristicsProperty = "Device Characteristics";

// Of a driver of kStorageDriverClass: size queries and data calls have one method.
constexpr std::uint32_t kStorageFetchMethod = 8;
enum StorageSelector : std::uint32_t {
  kSelectValidityList = 11,
  kSelectStatistics = 13,
  kSelectDefectsList = 15,
  kSelectTelemetryList = 17,
};

// A statistics buffer is little-endian records: a 32-bit statistic, a 32-bit count, and that many
// 64-bit values.
constexpr std::uint32_t kExportVersionStatistic = 53;
// A buffer with this record has every figure that its driver knows. Those that it lacks are not
// known, and are not reported; from other drivers they are 0.
constexpr std::uint32_t kKnownAloneStatistic = 0x2FFF'FF00;
// The lowest version whose buffers may have more than the oldest figures.
constexpr std::uint32_t kFullExportVersion = 0x20002;
// Host traffic is counted in units of this size.
constexpr std::uint64_t kHostUnitBytes = 4096;

struct ExportedStatistic {
  std::uint32_t statistic;
  std::string_view key;  // under which it is reported
};
constexpr ExportedStatistic kExportedStatistics[] = {
    {4, "vellum.NANDInfo.NumLogicalWrites"},
    {7, "vellum.NANDInfo.NumLogicalReads"},
    {11, "vellum.NANDInfo.UncleanBoots"},
    {20, "vellum.NANDInfo.NumPhysicalErases"},
    {45, "vellum.NANDInfo.HighEnduranceBlockEraseCount"},
    {49, "vellum.NANDInfo.BytesPerPage"},
    {50, "vellum.NANDInfo.PagesPerVirtualBlock"},
    {51, "vellum.NANDInfo.BlocksPerVirtualBlock"},
    {52, "vellum.NANDInfo.NumVirtualBlocks"},
    {414, "vellum.NANDInfo.ueccReads"},
    {430, "vellum.NANDInfo.IntermediatePartitionPEPercentUsed"},
    {431, "vellum.NANDInfo.UserPartitionPEPercentUsed"},
    {532, "vellum.NANDInfo.spareAvailablePercent"},
};

// Of a key without its prefix. A name that is not in the table does not compile.
consteval const ExportedStatistic& exportedStatistic(std::string_view name) {
  const auto* const found = std::ranges::find_if(
      kExportedStatistics, [&](const auto& row) { return row.key.substr(16) == name; });
  if (found == std::end(kExportedStatistics)) throw "not exported";
  return *found;
}

}  // namespace tally
