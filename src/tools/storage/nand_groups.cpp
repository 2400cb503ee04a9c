#include "tools/storage/nand_groups.h"

#include <algorithm>

#include "base/number_text.h"

namespace tally::tools {
namespace {

struct NamesOfGroup {
  std::string_view title;
  std::vector<std::string_view> beginnings;  // of names; the first group that fits takes a name
};

const std::vector<NamesOfGroup>& groupsOfNames() {
  static const std::vector<NamesOfGroup> groups = {
      {"Device",
       {"ExportVersion", "DriverVersion", "DemoMode", "NumVirtualBlocks", "PagesPerVirtualBlock",
        "pagesPerVirtualBlockSlc", "BytesPerPage", "BlocksPerVirtualBlock", "nandDesc", "q7mFwVer",
        "formatDaysSince2000", "IntermediatePartitionSize", "StaticDataSizeInMB"}},
      {"Space",
       {"NumFreeVirtualBlocks", "Nodes", "Reclaim.", "spareAvailablePercent", "numVertics",
        "maxVerticsInBand", "exceededCVertics"}},
      {"Wear",
       {"fwUpdatesPercentUsed", "IntermediatePartitionPEPercentUsed", "UserPartitionPEPercentUsed",
        "ColdestCycle", "HottestCycle", "IntermediateColdestCycle", "IntermediateHottestCycle",
        "HighEnduranceBlockEraseCount", "NumPhysicalErases", "NumWearLevelOps",
        "IntermediateBandErases", "ReadsBeforeErasure"}},
      {"Traffic",
       {"NumLogical", "NumPhysical", "hostWrites", "NumFlushes", "NumFences", "NumSleepOps",
        "VMFreezer.", "numFirmwareWrites", "numBisWrites", "SectorsPerHostFlow", "Pad", "commitPad",
        "directToTLC", "fallbackToWaterfall", "lockToTlc", "burstSize", "balanceProportion"}},
      {"Errors",
       {"ueccReads", "internalUeccs", "numPfail", "numEfail", "numGrownBad", "numFactoryBad",
        "raidSmartErrors", "E2E_", "BitFlip", "numCrossTempUecc", "openBandReadFail",
        "MetaMismatchReread", "numDieFailures", "firstFailedDieId", "UncleanBoots", "AbortSkip_"}},
      {"Reconstruction",
       {"SuccessfulReconstruction", "FailedReconstruction", "InvalidParity", "raid"}},
      {"Garbage collection and refresh",
       {"NumGC", "NumLOnlyGC", "gc", "NumIntermediateMoves", "NumRefreshes", "NumBandsRefreshed",
        "NumPaddingsForAge", "AgeInducedWriteSectors", "NumOfAvoidedGC", "slcInvalidations"}},
      {"Memory pressure", {"numMem", "maxMem", "mem", "NumHostChoke", "NumBandGets"}},
      {"Write cache and indirection", {"wcache", "indmb", "ind", "CacheDepthVsThroughput"}},
      {"Bands", {"Bands", "OverWrites", "Unmaps", "RD_"}},
      {"Maintenance and boot",
       {"NumMaintenanceRequests", "MaintenanceRequests", "maxGraceful", "maxUngraceful",
        "averageGraceful", "averageUngraceful", "gracefulBoot", "ungracefulBoot", "clog", "numClog",
        "maxFailedFastCxtSync", "numFWUpdates", "NumClockLoss", "cntCalTime"}},
      {"Other", {""}},
  };
  return groups;
}

std::size_t groupOf(std::string_view name) {
  const auto& groups = groupsOfNames();
  const auto fits = [&](std::string_view beginning) { return name.starts_with(beginning); };
  for (std::size_t group = 0; group < groups.size(); ++group) {
    if (std::ranges::any_of(groups[group].beginnings, fits)) return group;
  }
  return groups.size() - 1;
}

// A name that ends in a number, and the number.
struct Numbered {
  std::string_view base;
  std::int64_t number;
};
std::optional<Numbered> numberedName(std::string_view name) {
  const std::size_t start = name.find_last_not_of("0123456789") + 1;
  const auto number = parseInt64(name.substr(start));
  if (!number) return std::nullopt;
  return Numbered{name.substr(0, start), *number};
}

// The figures of a group as they come; those that count on from the former one join it.
void addFigure(std::vector<NandFigure>& figures, std::string_view name, std::int64_t value) {
  const auto numbered = numberedName(name);
  if (numbered) {
    for (NandFigure& figure : figures) {
      const auto former = figure.first ? std::nullopt : numberedName(figure.name);
      const std::string_view base = former ? former->base : std::string_view(figure.name);
      const std::int64_t first = figure.first.value_or(former ? former->number : -1);
      const auto next = first + static_cast<std::int64_t>(figure.values.size());
      if (first < 0 || base != numbered->base || next != numbered->number) continue;
      figure.first = first;
      figure.name = std::string(numbered->base);
      figure.values.push_back(value);
      return;
    }
  }
  figures.push_back({std::string(name), {value}});
}

}  // namespace

std::vector<NandGroup> groupNandInfo(const KvDictionary& info, std::string_view text) {
  std::vector<NandGroup> groups;
  for (const NamesOfGroup& group : groupsOfNames()) groups.push_back({group.title, {}});
  for (const auto& [key, value] : info) {
    const auto* number = kvCast<KvNumber>(value.get());
    if (number == nullptr || key->view().find(text) == std::string_view::npos) continue;
    std::string_view name = key->view();
    if (name.starts_with(kNandPrefix)) name.remove_prefix(kNandPrefix.size());
    addFigure(groups[groupOf(name)].figures, name, number->asInt64());
  }
  std::erase_if(groups, [](const NandGroup& group) { return group.figures.empty(); });
  return groups;
}

}  // namespace tally::tools
