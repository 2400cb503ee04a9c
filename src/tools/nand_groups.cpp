#include "tools/nand_groups.h"

#include <algorithm>
#include <map>

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

// The name without the number at its end.
std::string_view baseOf(std::string_view name) {
  const std::size_t last = name.find_last_not_of("0123456789");
  return last == std::string_view::npos ? name : name.substr(0, last + 1);
}

}  // namespace

std::vector<NandGroup> groupNandInfo(const KvDictionary& info, std::string_view text) {
  std::vector<NandGroup> groups;
  for (const NamesOfGroup& group : groupsOfNames()) groups.push_back({group.title, {}});
  std::map<std::string, std::pair<std::size_t, std::size_t>, std::less<>> families;
  for (const auto& [key, value] : info) {
    const auto* number = kvCast<KvNumber>(value.get());
    if (number == nullptr || key->view().find(text) == std::string_view::npos) continue;
    std::string_view name = key->view();
    if (name.starts_with(kNandPrefix)) name.remove_prefix(kNandPrefix.size());
    const std::string base(baseOf(name));
    const std::size_t group = groupOf(name);
    auto& figures = groups[group].figures;
    if (base.size() != name.size()) {
      const auto found = families.find(base);
      if (found != families.end()) {
        groups[found->second.first].figures[found->second.second].values.push_back(
            number->asInt64());
        continue;
      }
      families[base] = {group, figures.size()};
    }
    figures.push_back({std::string(name), {number->asInt64()}, false});
  }
  for (const auto& [base, place] : families) {
    NandFigure& figure = groups[place.first].figures[place.second];
    if (figure.values.size() < 2) continue;  // a single number is part of the name
    figure.isFamily = true;
    figure.name = base;
  }
  std::erase_if(groups, [](const NandGroup& group) { return group.figures.empty(); });
  return groups;
}

}  // namespace tally::tools
