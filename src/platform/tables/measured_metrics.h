// The scalars that the daily report measures itself, in the order in which it records them.
#pragma once

#include <cstddef>
#include <string_view>

namespace tally {

enum class MetricSource {
  AllApplications,
  UserApplications,
  StoreSize,
  StoreCorruptions,
  Uptime,
  KernelValue,       // as it is read
  KernelPercentage,  // of another kernel value
};

struct MeasuredMetric {
  std::string_view key;
  MetricSource source;
  std::string_view unit;
  std::string_view meaning;
  std::string_view kernelValue = {};  // its name, for the two sources that read one
  std::size_t width = 8;              // of the kernel value, in bytes; the first 8 are its number
  std::string_view percentageOf = {};
};

inline constexpr std::string_view kConsideredCount =
    "kern.memorystatus_freezer_process_considered_count";
inline constexpr std::string_view kBelowThresholdCount =
    "kern.memorystatus_freezer_below_threshold_count";

inline constexpr MeasuredMetric kMeasuredMetrics[] = {
    {"vellum.dockyard.numAllInstalledApps", MetricSource::AllApplications, "applications",
     "applications that are installed"},
    {"vellum.dockyard.numThirdPartyApps", MetricSource::UserApplications, "applications",
     "applications that the user installed"},
    {"vellum.sysmetra.tlyd.database.size", MetricSource::StoreSize, "MiB",
     "size of the metrics store's file"},
    {"vellum.sysmetra.tlyd.database.corruptions", MetricSource::StoreCorruptions, "corruptions",
     "corruptions of the metrics store since the last log"},
    {"vellum.usage.cur_boot_session_cpu_uptime", MetricSource::Uptime, "minutes",
     "time since boot"},
    {"vellum.kernel.memorystatus_freeze_count", MetricSource::KernelValue, "freezes",
     "processes that were frozen since boot", "kern.memorystatus_freeze_count", 4},
    {"vellum.kernel.memorystatus_freeze_pageouts", MetricSource::KernelValue, "pages",
     "pages that freezing wrote out since boot", "kern.memorystatus_freeze_pageouts"},
    {"vellum.kernel.memorystatus_freeze_budget_pages_remaining", MetricSource::KernelValue, "pages",
     "pages that freezing may still write out", "kern.memorystatus_freeze_budget_pages_remaining"},
    {"vellum.kernel.memorystatus_thaw_count", MetricSource::KernelValue, "thaws",
     "frozen processes that were resumed since boot", "kern.memorystatus_thaw_count", 4},
    {"vellum.kernel.swapusage", MetricSource::KernelValue, "bytes", "size of the swap space",
     "vm.swapusage", 32},
    {"vellum.memorystatus_freezer_error_excess_shared_memory_count", MetricSource::KernelPercentage,
     "percent", "processes considered that shared too much memory to be frozen",
     "kern.memorystatus_freezer_error_excess_shared_memory_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_error_low_private_shared_ratio_count",
     MetricSource::KernelPercentage, "percent",
     "processes considered that had too little private memory to be frozen",
     "kern.memorystatus_freezer_error_low_private_shared_ratio_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_error_no_compressor_space_count", MetricSource::KernelPercentage,
     "percent", "processes considered that were not frozen for lack of compressor space",
     "kern.memorystatus_freezer_error_no_compressor_space_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_error_no_swap_space_count", MetricSource::KernelPercentage,
     "percent", "processes considered that were not frozen for lack of swap space",
     "kern.memorystatus_freezer_error_no_swap_space_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_error_below_min_pages_count", MetricSource::KernelPercentage,
     "percent", "processes considered that had too few pages to be frozen",
     "kern.memorystatus_freezer_error_below_min_pages_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_error_low_probability_of_use_count",
     MetricSource::KernelPercentage, "percent",
     "processes considered that were too unlikely to be used again",
     "kern.memorystatus_freezer_error_low_probability_of_use_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_error_other_count", MetricSource::KernelPercentage, "percent",
     "processes considered that were not frozen for another reason",
     "kern.memorystatus_freezer_error_other_count", 8, kConsideredCount},
    {"vellum.memorystatus_freezer_skipped_full_count", MetricSource::KernelPercentage, "percent",
     "freezes below the threshold that were skipped as all slots were full",
     "kern.memorystatus_freezer_skipped_full_count", 8, kBelowThresholdCount},
    {"vellum.memorystatus_freezer_skipped_shared_mb_high_count", MetricSource::KernelPercentage,
     "percent", "freezes below the threshold that were skipped as too much memory was shared",
     "kern.memorystatus_freezer_skipped_shared_mb_high_count", 8, kBelowThresholdCount},
    {"vellum.memorystatus_freezer_shared_pages_skipped", MetricSource::KernelValue, "pages",
     "shared pages that freezing skipped", "kern.memorystatus_freezer_shared_pages_skipped"},
    {"vellum.memorystatus_freezer_thaw_percentage", MetricSource::KernelValue, "percent",
     "frozen processes that were resumed", "kern.memorystatus_freezer_thaw_percentage"},
};

}  // namespace tally
