// From a parsed context to the NAND info dictionary.
#include "storage/nand_info.h"

#include <algorithm>
#include <array>
#include <optional>
#include <string_view>

#include "base/time_text.h"
#include "platform/platform.h"
#include "platform/protocol/storage_protocol.h"
#include "platform/tables/known_preferences.h"
#include "storage/nand_info/nand_info_failure.h"
#include "storage/statistics/counter_names.h"
#include "storage/statistics/key_map.h"
#include "storage/statistics/statistic_keys.h"

namespace tally {

double gCurrentUserWamp = 0;
double gCurrentSysWamp = 0;

namespace {

constexpr std::size_t kUsualEntries = 760;

struct NarrowKey {
  std::string_view key;
  std::uint32_t SPXParseContext::*field;
};
struct WideKey {
  std::string_view key;
  std::uint64_t SPXParseContext::*field;
};
constexpr NarrowKey kVersionKeys[] = {
    {kNANDInfoExportVersionKey, &SPXParseContext::exportVersion},
    {kNANDInfoDriverVersionKey, &SPXParseContext::driverVersion},
};
constexpr NarrowKey kGeometryKeys[] = {
    {kNANDInfoNumVirtualBlocksKey, &SPXParseContext::numVirtualBlocks},
    {kNANDInfoPagesPerVirtualBlockKey, &SPXParseContext::pagesPerVirtualBlock},
    {kNANDInfoBytesPerPageKey, &SPXParseContext::bytesPerPage},
};
constexpr WideKey kOperationKeys[] = {
    {kNANDInfoNumLogicalReadsKey, &SPXParseContext::hostReads},
    {kNANDInfoNumLogicalWritesKey, &SPXParseContext::hostWrites},
    {kNANDInfoNumFreeVirtualBlocksKey, &SPXParseContext::numFreeVirtualBlocks},
    {kNANDInfoNumWearLevelOpsKey, &SPXParseContext::wearLevMoves},
    {kNANDInfoNumPhysicalReadsKey, &SPXParseContext::nandReads},
    {kNANDInfoNumPhysicalWritesKey, &SPXParseContext::nandWrites},
    {kNANDInfoNumPhysicalErasesKey, &SPXParseContext::bandErases},
    {kNANDInfoNumNodesFreeKey, &SPXParseContext::indPoolFree},
    {kNANDInfoNumNodesTotalKey, &SPXParseContext::indPoolCount},
};

KvRef<KvNumber> narrowNumber(std::uint32_t value) {
  return KvNumber::int32(static_cast<std::int32_t>(value));
}
KvRef<KvNumber> wideNumber(std::uint64_t value) {
  return KvNumber::int64(static_cast<std::int64_t>(value));
}

template <class Keys>
void addFields(KvDictionary& info, const SPXParseContext& context, const Keys& keys) {
  for (const auto& [key, field] : keys) {
    if constexpr (sizeof(context.*field) == sizeof(std::uint32_t)) {
      info.set(key, narrowNumber(context.*field));
    } else {
      info.set(key, wideNumber(context.*field));
    }
  }
}

bool isDemoMode() {
  bool exists = false;
  constexpr const KnownPreference& kDemo = knownPreference("StoreDemoMode");
  const bool demo =
      platform().preferences->SMAPreferencesGetBoolValue(kDemo.key, kDemo.domain, &exists);
  return exists && demo;
}

std::uint64_t weeksSince2000(std::uint64_t secondsSince1970) {
  constexpr std::uint64_t k2000 = 946'684'800;
  constexpr auto kWeek = static_cast<std::uint64_t>(7 * kSecondsPerDay);
  return secondsSince1970 <= k2000 ? 0 : (secondsSince1970 - k2000) / kWeek;
}

// Durations that could identify a device are reported to three significant digits.
std::uint32_t threeSignificantDigits(std::uint32_t value) {
  std::uint32_t step = 1;
  while (value / step >= 1000) step *= 10;
  const std::uint32_t kept = value / step;
  const std::uint32_t rest = value % step;
  return (kept + (step > 1 && rest >= step / 2 ? 1 : 0)) * step;
}

// Counters that are not reported themselves but are part of a derived figure.
enum class Role : std::uint8_t {
  None,
  UserPartitionStart,
  IntermediatePartitionStart,
  MaintenanceRequest,
  FailedRead,
  FailedProg,
  FailedErase,
};
struct RoleOfName {
  std::string_view name;
  Role role;
};
constexpr RoleOfName kRoles[] = {
    {"userPartitionStart", Role::UserPartitionStart},
    {"intermediatePartitionStart", Role::IntermediatePartitionStart},
    {"numBootBlockRefreshSuccess0", Role::MaintenanceRequest},
    {"numBootBlockRefreshFail0", Role::MaintenanceRequest},
    {"mspBootBlockReadFail0", Role::FailedRead},
    {"mspBootBlockReadFail1", Role::FailedRead},
    {"mspBootBlockReadFail2", Role::FailedRead},
    {"mspBootBlockProgFail0", Role::FailedProg},
    {"mspBootBlockProgFail1", Role::FailedProg},
    {"mspBootBlockProgFail2", Role::FailedProg},
    {"mspBootBlockEraseFail0", Role::FailedErase},
    {"mspBootBlockEraseFail1", Role::FailedErase},
    {"mspBootBlockEraseFail2", Role::FailedErase},
};

constexpr std::string_view kRoundedDurations[] = {"maxMemLowDuration", "maxMemChokeDuration"};

// A misspelt name would silently leave its counter out of a figure.
constexpr bool isCounter(std::string_view name) {
  for (std::size_t number = 0; number < kCounterNames; ++number) {
    if (kNames.name(number) == name) return true;
  }
  return false;
}
static_assert(std::ranges::all_of(kRoles,
                                  [](const RoleOfName& row) { return isCounter(row.name); }));
static_assert(std::ranges::all_of(kRoundedDurations, [](auto name) { return isCounter(name); }));

// How the counter of each name number is treated.
struct Treatment {
  Role role = Role::None;
  bool isRounded = false;
};
using Treatments = std::array<Treatment, kCounterNames>;

constexpr Treatments makeTreatments() {
  Treatments treatments{};
  for (std::size_t number = 0; number < kCounterNames; ++number) {
    const std::string_view name = kNames.name(number);
    for (const RoleOfName& row : kRoles) {
      if (row.name == name) treatments[number].role = row.role;
    }
    for (const std::string_view rounded : kRoundedDurations) {
      if (rounded == name) treatments[number].isRounded = true;
    }
  }
  return treatments;
}

constexpr Treatments kTreatments = makeTreatments();

// The figures that are derived from several counters.
struct DerivedFigures {
  std::optional<std::uint64_t> userPartitionStart, intermediatePartitionStart;
  std::uint64_t maintenanceRequests = 0, failedReads = 0, failedProgs = 0, failedErases = 0;

  void take(Role role, std::uint64_t value) {
    const std::uint64_t failed = value != 0 ? 1 : 0;
    switch (role) {
      case Role::None:
        break;
      case Role::UserPartitionStart:
        userPartitionStart = value;
        break;
      case Role::IntermediatePartitionStart:
        intermediatePartitionStart = value;
        break;
      case Role::MaintenanceRequest:
        maintenanceRequests += value;
        break;
      case Role::FailedRead:
        failedReads += failed;
        break;
      case Role::FailedProg:
        failedProgs += failed;
        break;
      case Role::FailedErase:
        failedErases += failed;
        break;
    }
  }
};

void addCounter(KvDictionary& info, DerivedFigures& derived, std::uint16_t name,
                std::uint64_t value) {
  const Treatment treatment = kTreatments[name];
  if (treatment.role != Role::None) {
    derived.take(treatment.role, value);
    return;
  }
  const std::uint16_t row = keyMapRowOfName(name);
  if (row == kNoRow) return;
  if (treatment.isRounded) value = threeSignificantDigits(static_cast<std::uint32_t>(value));
  info.set(keyMapKey(row), wideNumber(value));
}

DerivedFigures addCounters(KvDictionary& info, const SPXParseContext& context) {
  DerivedFigures derived;
  for (const SPXCounterBlock* block = context.firstBlock; block != nullptr; block = block->next) {
    for (std::uint32_t i = 0; i < block->count; ++i) {
      const std::uint16_t name = block->names()[i];
      if (name < kCounterNames) addCounter(info, derived, name, block->values()[i]);
    }
  }
  return derived;
}

void addDerivedFigures(KvDictionary& info, const DerivedFigures& derived) {
  if (derived.userPartitionStart && derived.intermediatePartitionStart) {
    info.set(kNANDInfoIntermediatePartitionSizeKey,
             wideNumber(*derived.userPartitionStart - *derived.intermediatePartitionStart));
  }
  info.set(kNANDInfoNumMaintenanceRequestsKey, wideNumber(derived.maintenanceRequests));
  info.set(kNANDInfoMaintenanceFailedReadKey, wideNumber(derived.failedReads));
  info.set(kNANDInfoMaintenanceFailedProgKey, wideNumber(derived.failedProgs));
  info.set(kNANDInfoMaintenanceFailedEraseKey, wideNumber(derived.failedErases));
}

// The figures that are always there, and the statistic of each; 0: no buffer has it.
struct FixedFigure {
  std::string_view key;
  std::uint32_t statistic;
};
constexpr FixedFigure kFixedFigures[] = {
    {kNANDInfoDriverVersionKey, 0},
    {kNANDInfoNumVirtualBlocksKey, 52},
    {kNANDInfoPagesPerVirtualBlockKey, 50},
    {kNANDInfoBytesPerPageKey, 49},
    {kNANDInfoNumLogicalReadsKey, 7},
    {kNANDInfoNumLogicalWritesKey, 4},
    {kNANDInfoNumFreeVirtualBlocksKey, 48},
    {kNANDInfoNumWearLevelOpsKey, 17},
    {kNANDInfoNumPhysicalReadsKey, 19},
    {kNANDInfoNumPhysicalWritesKey, 18},
    {kNANDInfoNumPhysicalErasesKey, 20},
    {kNANDInfoNumNodesFreeKey, 12},
    {kNANDInfoNumNodesTotalKey, 13},
    {kNANDInfoFormatWeeksSince2000Key, 56},
    {kNANDInfoNumSleepOpsKey, 28},
    {kNANDInfoHighEnduranceBlockEraseCountKey, 45},
    {kNANDInfoBlocksPerVirtualBlock, 51},
    {kNANDInfoReadsBeforeErasureKeys[0], 265},
    {kNANDInfoReadsBeforeErasureKeys[1], 265},
    {kNANDInfoReadsBeforeErasureKeys[2], 265},
    {kNANDInfoReadsBeforeErasureKeys[3], 265},
    {kNANDInfoReadsBeforeErasureKeys[4], 265},
    {kNANDInfoNumMaintenanceRequestsKey, 0},
    {kNANDInfoMaintenanceFailedReadKey, 0},
    {kNANDInfoMaintenanceFailedProgKey, 0},
    {kNANDInfoMaintenanceFailedEraseKey, 0},
};

bool hasStatistic(const SPXParseContext& context, std::uint32_t key) {
  const Statistic* const statistic = findStatistic(key);
  for (const auto* block = context.firstBlock; block != nullptr; block = block->next) {
    const auto* const names = block->names();
    // The plain name, and those of the elements where there are several.
    const auto isOfStatistic = [&](std::uint16_t name) {
      const std::uint16_t last = statistic->elements > 1 ? statistic->elements : 0;
      return name >= statistic->name && name <= statistic->name + last;
    };
    if (statistic != nullptr && std::any_of(names, names + block->count, isOfStatistic))
      return true;
  }
  return false;
}

void removeUnknown(KvDictionary& info, const SPXParseContext& context) {
  for (const auto& [key, statistic] : kFixedFigures) {
    if (!hasStatistic(context, statistic)) info.remove(key);
  }
}

}  // namespace

KvRef<KvDictionary> buildNandInfo(const SPXParseContext& context, bool forDump) {
  if (context.exportVersion == 0) {
    return forDump ? nullptr : nandInfoFailure("Unsupported export version");
  }
  auto info = KvDictionary::create(kUsualEntries);
  if (!forDump) {
    addFields(*info, context, kVersionKeys);
    info->set(kNANDInfoDemoModeKey, wideNumber(isDemoMode() ? 1 : 0));
  }
  addFields(*info, context, kGeometryKeys);
  addFields(*info, context, kOperationKeys);
  if (context.exportVersion < kFullExportVersion) return info;

  info->set(kNANDInfoFormatWeeksSince2000Key, wideNumber(weeksSince2000(context.utilFormatTime)));
  info->set(kNANDInfoNumSleepOpsKey, wideNumber(context.numSleepOps));
  info->set(kNANDInfoHighEnduranceBlockEraseCountKey,
            wideNumber(context.maxHighEnduranceBlockErases));
  info->set(kNANDInfoBlocksPerVirtualBlock, narrowNumber(context.blocksPerVirtualBlock));
  for (std::size_t i = 0; i < context.readCountHisto.size(); ++i) {
    info->set(kNANDInfoReadsBeforeErasureKeys[i], wideNumber(context.readCountHisto[i]));
  }
  addDerivedFigures(*info, addCounters(*info, context));
  if (context.exportsKnownAlone) removeUnknown(*info, context);
  return info;
}

}  // namespace tally
