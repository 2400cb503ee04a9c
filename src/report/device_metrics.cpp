// What the report measures itself: applications, languages, the store's file, uptime, kernel
// counters.
#include <algorithm>
#include <cstring>
#include <string>

#include "platform/platform.h"
#include "report/report.h"
#include "report/saturate.h"

namespace tally {

// A kernel value that is recorded as it is read.
struct KernelCounter {
  std::string_view key;    // of the report
  std::string_view name;   // of the kernel
  std::size_t width;       // bytes that are read
  std::size_t valueWidth;  // of which the first are the value, an unsigned integer
};

namespace {

constexpr std::string_view kStorePath = "/var/mobile/Library/Tallybook/TBDataStore.sqlitedb";
constexpr std::int64_t kMebibyte = 1048576;
constexpr std::string_view kStoreDomain = "vellum.tallyd";
constexpr std::string_view kCorruptionCount = "DatabaseCorruptionCount";

constexpr std::string_view kAllApps = "vellum.dockyard.numAllInstalledApps";
constexpr std::string_view kThirdPartyApps = "vellum.dockyard.numThirdPartyApps";
constexpr std::string_view kStoreSize = "vellum.sysmetra.tlyd.database.size";
constexpr std::string_view kStoreCorruptions = "vellum.sysmetra.tlyd.database.corruptions";
constexpr std::string_view kUptime = "vellum.usage.cur_boot_session_cpu_uptime";

constexpr KernelCounter kFreezerCounters[] = {
    {"vellum.kernel.memorystatus_freeze_count", "kern.memorystatus_freeze_count", 4, 4},
    {"vellum.kernel.memorystatus_freeze_pageouts", "kern.memorystatus_freeze_pageouts", 8, 8},
    {"vellum.kernel.memorystatus_freeze_budget_pages_remaining",
     "kern.memorystatus_freeze_budget_pages_remaining", 8, 8},
    {"vellum.kernel.memorystatus_thaw_count", "kern.memorystatus_thaw_count", 4, 4},
    {"vellum.kernel.swapusage", "vm.swapusage", 32, 8},
};
constexpr KernelCounter kFreezerShares[] = {
    {"vellum.memorystatus_freezer_shared_pages_skipped",
     "kern.memorystatus_freezer_shared_pages_skipped", 8, 8},
    {"vellum.memorystatus_freezer_thaw_percentage", "kern.memorystatus_freezer_thaw_percentage", 8,
     8},
};
// Counters that are recorded as a percentage of another; the kernel's name and the report's key
// differ in their first word only.
constexpr std::string_view kErrorCounters[] = {
    "memorystatus_freezer_error_excess_shared_memory_count",
    "memorystatus_freezer_error_low_private_shared_ratio_count",
    "memorystatus_freezer_error_no_compressor_space_count",
    "memorystatus_freezer_error_no_swap_space_count",
    "memorystatus_freezer_error_below_min_pages_count",
    "memorystatus_freezer_error_low_probability_of_use_count",
    "memorystatus_freezer_error_other_count",
};
constexpr std::string_view kSkippedCounters[] = {
    "memorystatus_freezer_skipped_full_count",
    "memorystatus_freezer_skipped_shared_mb_high_count",
};
constexpr std::string_view kConsideredCount = "kern.memorystatus_freezer_process_considered_count";
constexpr std::string_view kBelowThresholdCount = "kern.memorystatus_freezer_below_threshold_count";

// Empty when the value cannot be read.
std::optional<std::uint64_t> readUnsigned(std::string_view name, std::size_t width,
                                          std::size_t valueWidth) {
  std::byte buffer[32] = {};
  std::size_t length = width;
  if (platform().kernelValues->readKernelValue(name, {buffer, width}, &length) != 0) {
    return std::nullopt;
  }
  std::uint64_t value = 0;
  std::memcpy(&value, buffer, valueWidth);
  return value;
}

// A failed read shows as all ones in the value's width.
std::int64_t readCounter(const KernelCounter& counter) {
  const std::uint64_t failed = counter.valueWidth == 4 ? UINT32_MAX : UINT64_MAX;
  return static_cast<std::int64_t>(
      readUnsigned(counter.name, counter.width, counter.valueWidth).value_or(failed));
}

// Makes sure that the entry points of the crash-reporting support library are at hand.
bool loadAccessors() {
  CrashSupportLibrary& library = *platform().crashSupportLibrary;
  CrashSupportLibrary::Accessors& found = library.accessors;
  if (found.getIntegerValue && found.setValue) return true;
  if (!library.open(kCrashSupportPath)) {
    logMessage(LogLevel::Error, "Failed to dynamically load the FaultDeskSupport framework");
    return false;
  }
  found.getIntegerValue = library.hasSymbol(kCrashSupportSymbols[0]);
  if (!found.getIntegerValue) {
    logMessage(LogLevel::Error, "Failed to dyanmically link SMAPreferencesGetIntegerValue");
  }
  found.setValue = library.hasSymbol(kCrashSupportSymbols[1]);
  if (!found.setValue) {
    logMessage(LogLevel::Error, "Failed to dynamically link SMAPreferencesSetValue");
  }
  return found.getIntegerValue && found.setValue;
}

constexpr std::string_view kKeyWord = "vellum.";
constexpr std::string_view kKernelWord = "kern.";

}  // namespace

bool isMeasuredByReport(std::string_view key) {
  const auto named = [key](const KernelCounter& counter) { return counter.key == key; };
  const auto isShare = [key](std::string_view name) {
    return key.starts_with(kKeyWord) && key.substr(kKeyWord.size()) == name;
  };
  const std::string_view single[] = {kAllApps, kThirdPartyApps, kStoreSize, kStoreCorruptions,
                                     kUptime};
  return std::ranges::find(single, key) != std::end(single) ||
         std::ranges::any_of(kFreezerCounters, named) ||
         std::ranges::any_of(kFreezerShares, named) ||
         std::ranges::any_of(kErrorCounters, isShare) ||
         std::ranges::any_of(kSkippedCounters, isShare);
}

std::vector<KernelValueName> kernelValuesOfReport() {
  std::vector<KernelValueName> names;
  for (const auto& counters : {std::span<const KernelCounter>(kFreezerCounters),
                               std::span<const KernelCounter>(kFreezerShares)}) {
    for (const KernelCounter& counter : counters) {
      names.push_back({std::string(counter.name), counter.width});
    }
  }
  for (const auto& shares : {std::span<const std::string_view>(kErrorCounters),
                             std::span<const std::string_view>(kSkippedCounters)}) {
    for (const std::string_view name : shares) {
      names.push_back({std::string(kKernelWord) + std::string(name), 8});
    }
  }
  for (const std::string_view name : {kConsideredCount, kBelowThresholdCount}) {
    names.push_back({std::string(name), 8});
  }
  return names;
}

void TBReport::addInstalledAppInfo() {
  const auto* allOptions = scalarOptions(kAllApps);
  const auto* thirdPartyOptions = scalarOptions(kThirdPartyApps);
  if (allOptions == nullptr && thirdPartyOptions == nullptr) return;
  std::int64_t all = 0;
  std::int64_t thirdParty = 0;
  platform().appRegistry->enumerateBundles(kBundleKindApplication, [&](std::string_view type) {
    ++all;
    if (type == UserAppType) ++thirdParty;
  });
  if (allOptions != nullptr) addScalarForKeyWithOptions(all, kAllApps, *allOptions);
  if (thirdPartyOptions != nullptr) {
    addScalarForKeyWithOptions(thirdParty, kThirdPartyApps, *thirdPartyOptions);
  }
}

void TBReport::addMetadataKeys() {
  Locale& locale = *platform().locale;
  const auto preferred = locale.PreferredLanguages();
  const auto best = BestLocalizations(locale.SystemLanguages(), preferred);
  const auto setFirst = [this](std::string_view key, const std::vector<std::string>& languages) {
    _metadataOutput->set(key,
                         KvString::create(languages.empty() ? "<unknown>" : languages.front()));
  };
  setFirst("TBUserInterfaceLanguage", best);
  setFirst("TBPreferredUserInterfaceLanguage", preferred);
  if (const auto region = locale.CurrentRegionCode()) {
    _metadataOutput->set("TBUserSetRegionFormat", KvString::create(*region));
  }
}

void TBReport::reportDatabaseSize() {
  if (const auto* options = scalarOptions(kStoreSize)) {
    const auto size = platform().files->fileSize(kStorePath);
    addScalarForKeyWithOptions(size ? static_cast<std::int64_t>(*size) / kMebibyte : -1, kStoreSize,
                               *options);
  }
  if (const auto* options = scalarOptions(kStoreCorruptions)) {
    std::int64_t corruptions = 0;
    if (loadAccessors()) {
      Preferences& preferences = *platform().preferences;
      corruptions = preferences.SMAPreferencesGetIntegerValue(kCorruptionCount, kStoreDomain);
      preferences.SMAPreferencesSetValue(kCorruptionCount, KvNumber::int32(0), kStoreDomain);
    }
    addScalarForKeyWithOptions(corruptions, kStoreCorruptions, *options);
  }
}

void TBReport::reportCPUUptime() {
  addScalarForKeyByExecutingBlock(kUptime, []() {
    KernelValues& kernel = *platform().kernelValues;
    const auto ticks = static_cast<double>(kernel.MonotonicTicks());
    const auto timebase = kernel.TimebaseInfo();
    if (!timebase || timebase->denominator == 0) {
      logMessage(LogLevel::Error, "Couldn't retrieve mach_timebase_info");
      return std::optional<std::int64_t>(-1);
    }
    const double minutesPerTick =
        (timebase->numerator * 0.000000001) / timebase->denominator / 60.0;
    return std::optional(saturatedInt64(ticks * minutesPerTick));
  });
}

void TBReport::reportVMStats() {
  recordKernelCounters(kFreezerCounters);
  recordPercentages(kConsideredCount, kErrorCounters);
  recordPercentages(kBelowThresholdCount, kSkippedCounters);
  recordKernelCounters(kFreezerShares);
}

void TBReport::recordKernelCounters(std::span<const KernelCounter> counters) {
  for (const KernelCounter& counter : counters) {
    addScalarForKeyByExecutingBlock(counter.key, [&counter] { return readCounter(counter); });
  }
}

void TBReport::recordPercentages(std::string_view denominator,
                                 std::span<const std::string_view> names) {
  const auto total = readUnsigned(denominator, 8, 8);
  if (!total) return;
  for (const std::string_view name : names) {
    addScalarForKeyByExecutingBlock(std::string(kKeyWord) + std::string(name), [&]() {
      const auto count = readUnsigned(std::string(kKernelWord) + std::string(name), 8, 8);
      // A share of nothing, or of a counter that could not be read, has no meaning.
      if (!count || *total == 0) return std::optional<std::int64_t>();
      return std::optional(
          saturatedInt64(static_cast<double>(*count) / static_cast<double>(*total) * 100));
    });
  }
}

}  // namespace tally
