#include "storage/nand_info/figure_texts.h"

#include <algorithm>
#include <set>
#include <string>

#include "storage/freezer.h"
#include "storage/health.h"
#include "storage/nand_info.h"
#include "storage/nand_info/figure_groups.h"
#include "storage/reclaim.h"
#include "storage/statistics/key_map.h"

namespace tally {
namespace {

constexpr std::string_view kHostUnit = "4 KiB";

constexpr FigureText kFigureTexts[] = {
    {kNANDInfoExportVersionKey, "version", "format of the driver's statistics"},
    {kNANDInfoDriverVersionKey, "version", "version of the driver"},
    {kNANDInfoDemoModeKey, "1 or 0", "whether the storage is in demo mode"},
    {kNANDInfoNumVirtualBlocksKey, "blocks", "erase blocks of the storage"},
    {kNANDInfoPagesPerVirtualBlockKey, "pages", "pages of an erase block"},
    {kNANDInfoBytesPerPageKey, "bytes", "size of a page"},
    {kNANDInfoBlocksPerVirtualBlock, "blocks", "physical blocks of an erase block"},
    {kNANDInfoFormatWeeksSince2000Key, "weeks", "when the storage was formatted, since 2000-01-01"},
    {kNANDInfoIntermediatePartitionSizeKey, "blocks", "size of the fast partition"},
    {kNANDInfoNumFreeVirtualBlocksKey, "blocks", "erase blocks that are free"},
    {kNANDInfoNumNodesFreeKey, "nodes", "nodes of the indirection table that are free"},
    {kNANDInfoNumNodesTotalKey, "nodes", "nodes of the indirection table"},
    {kNANDInfoReclaimTotalPurgeableKey, "bytes", "space that the system may reclaim"},
    {kNANDInfoReclaimTotalNonPurgeableKey, "bytes", "space that the system may not reclaim"},
    {kNANDInfoHighEnduranceBlockEraseCountKey, "erasures", "of the most erased block"},
    {kNANDInfoNumPhysicalErasesKey, "erasures", "of all blocks"},
    {kNANDInfoNumWearLevelOpsKey, "moves", "data moved to level the wear"},
    {kNANDInfoNumLogicalReadsKey, kHostUnit, "data that the host read"},
    {kNANDInfoNumLogicalWritesKey, kHostUnit, "data that the host wrote"},
    {kNANDInfoNumPhysicalReadsKey, kHostUnit, "data read from the flash"},
    {kNANDInfoNumPhysicalWritesKey, kHostUnit, "data written to the flash"},
    {kNANDInfoVMFreezerNumPhysicalWritesKey, "bytes", "written by the memory freezer"},
    {kNANDInfoHealthMaxPercentageNANDUsedKey, "percent", "of the rated life, the most worn part"},
    {kNANDInfoHealthMaxE2EErrorsKey, "errors", "end-to-end errors, the highest of all counters"},
    {kNANDInfoHealthHostReadErrorsKey, "errors", "host reads that could not be corrected"},
    {kNANDInfoHealthIsNANDRefurbishableKey, "1 or 0", "whether the storage may be used again"},
    {kNANDInfoHealthIsNANDRetirableKey, "1 or 0", "whether the storage should be retired"},
    {"vellum.NANDInfo.UserPartitionPEPercentUsed", "percent", "of the storage's rated life used"},
    {"vellum.NANDInfo.IntermediatePartitionPEPercentUsed", "percent",
     "of the fast partition's rated life used"},
    {"vellum.NANDInfo.spareAvailablePercent", "percent", "of the spare blocks left"},
    {"vellum.NANDInfo.UncleanBoots", "shutdowns", "power lost without a shutdown"},
    {"vellum.NANDInfo.ueccReads", "reads", "reads that could not be corrected"},
};

// What a counter counts, as its name says; the first that the name contains.
struct UnitWord {
  std::string_view word, unit;
};
constexpr UnitWord kUnitWords[] = {
    {"Percent", "percent"}, {"Precent", "percent"},  {"Histo", "count"},     {"Log", "count"},
    {"InMB", "MB"},         {"TimeMs", "ms"},        {"Sectors", "sectors"}, {"Secs", "sectors"},
    {"Bands", "bands"},     {"bands", "bands"},      {"Erases", "erasures"}, {"Errors", "errors"},
    {"PadSize", "sectors"}, {"Writes", "writes"},    {"Reads", "reads"},     {"Refreshes", "bands"},
    {"Flushes", "flushes"}, {"BadBlocks", "blocks"}, {"GrownBad", "blocks"}, {"Version", "version"},
    {"FwVer", "version"},   {"nandDesc", "version"},
};

std::string_view impliedUnit(std::string_view key) {
  const auto* const found = std::ranges::find_if(
      kUnitWords, [key](const UnitWord& row) { return key.find(row.word) != key.npos; });
  return found != std::end(kUnitWords) ? found->unit : "count";
}

std::string groupTitle(std::string_view key) {
  const FigureGroup group = figureGroup(key);
  const auto* const found = std::ranges::find(kFigureGroups, group, &FigureGroupTitle::group);
  return "flash storage: " + (found != kFigureGroups.end() ? std::string(found->title) : "other");
}

}  // namespace

void eachFigureText(const std::function<void(const FigureText&)>& handler) {
  std::set<std::string_view> seen;
  for (const FigureText& text : kFigureTexts) {
    if (seen.insert(text.key).second) handler(text);
  }
  const auto others = [&](std::string_view key) {
    if (seen.insert(key).second) handler({key, impliedUnit(key), groupTitle(key)});
  };
  for (const std::string_view key : kNANDInfoReadsBeforeErasureKeys) others(key);
  for (std::size_t row = 0; row < keyMap.size(); ++row) others(keyMap[row].key);
}

}  // namespace tally
