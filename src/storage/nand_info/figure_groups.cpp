#include "storage/nand_info/figure_groups.h"

#include <algorithm>
#include <unordered_map>

#include "storage/freezer.h"
#include "storage/nand_info.h"
#include "storage/reclaim.h"
#include "storage/statistics/key_map.h"

namespace tally {
namespace {

using enum FigureGroup;

struct KeyGroup {
  std::string_view key;
  FigureGroup group;
};

// The figures that are not a counter of their own. Counters have their group in the counter table.
constexpr KeyGroup kKeyGroups[] = {
    {kNANDInfoExportVersionKey, Device},
    {kNANDInfoDriverVersionKey, Device},
    {kNANDInfoDemoModeKey, Device},
    {kNANDInfoNumVirtualBlocksKey, Device},
    {kNANDInfoPagesPerVirtualBlockKey, Device},
    {kNANDInfoBytesPerPageKey, Device},
    {kNANDInfoBlocksPerVirtualBlock, Device},
    {kNANDInfoFormatWeeksSince2000Key, Device},
    {kNANDInfoIntermediatePartitionSizeKey, Device},
    {kNANDInfoNumFreeVirtualBlocksKey, Space},
    {kNANDInfoNumNodesFreeKey, Space},
    {kNANDInfoNumNodesTotalKey, Space},
    {kNANDInfoReclaimTotalPurgeableKey, Space},
    {kNANDInfoReclaimTotalNonPurgeableKey, Space},
    {kNANDInfoReclaimErrorKey, Space},
    {kNANDInfoHighEnduranceBlockEraseCountKey, Wear},
    {kNANDInfoNumPhysicalErasesKey, Wear},
    {kNANDInfoNumWearLevelOpsKey, Wear},
    {kNANDInfoReadsBeforeErasureKeys[0], Wear},
    {kNANDInfoReadsBeforeErasureKeys[1], Wear},
    {kNANDInfoReadsBeforeErasureKeys[2], Wear},
    {kNANDInfoReadsBeforeErasureKeys[3], Wear},
    {kNANDInfoReadsBeforeErasureKeys[4], Wear},
    {kNANDInfoNumLogicalReadsKey, Traffic},
    {kNANDInfoNumLogicalWritesKey, Traffic},
    {kNANDInfoNumPhysicalReadsKey, Traffic},
    {kNANDInfoNumPhysicalWritesKey, Traffic},
    {kNANDInfoNumSleepOpsKey, Traffic},
    {kNANDInfoVMFreezerNumPhysicalWritesKey, Traffic},
    {kNANDInfoNumMaintenanceRequestsKey, Maintenance},
    {kNANDInfoMaintenanceFailedReadKey, Maintenance},
    {kNANDInfoMaintenanceFailedProgKey, Maintenance},
    {kNANDInfoMaintenanceFailedEraseKey, Maintenance},
};

using GroupsByKey = std::unordered_map<std::string_view, FigureGroup>;

GroupsByKey groupsByKey() {
  GroupsByKey groups;
  for (const auto& [key, group] : kKeyGroups) groups.emplace(key, group);
  for (std::size_t row = 0; row < keyMap.size(); ++row) {
    groups.emplace(keyMap[row].key, keyMapGroup(row));
  }
  return groups;
}

}  // namespace

FigureGroup figureGroup(std::string_view key) {
  static const GroupsByKey groups = groupsByKey();
  const auto found = groups.find(key);
  return found == groups.end() ? Other : found->second;
}

}  // namespace tally
