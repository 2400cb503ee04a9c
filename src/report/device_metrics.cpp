#include "report/device_metrics.h"

#include <algorithm>
#include <cstdint>
#include <optional>

#include "base/byte_reader.h"
#include "config/saturate.h"
#include "platform/tables/known_preferences.h"
#include "platform/tables/measured_metrics.h"
#include "platform/tables/own_metrics.h"

namespace tally {
namespace {

using Measured = std::optional<std::int64_t>;  // empty: not recorded

constexpr std::int64_t kMebibyte = 1048576;
constexpr std::size_t kLargestKernelValue = 32, kNumberWidth = 8;

constexpr const MeasuredMetric& metricOf(MetricSource source) {
  return *std::ranges::find(kMeasuredMetrics, source, &MeasuredMetric::source);
}

constexpr bool isWellFormed(const MeasuredMetric& metric) {
  const bool readsKernel =
      metric.source == MetricSource::KernelValue || metric.source == MetricSource::KernelPercentage;
  return !metric.key.empty() && !metric.unit.empty() && metric.width <= kLargestKernelValue &&
         (metric.width == 4 || metric.width >= kNumberWidth) &&
         metric.kernelValue.empty() != readsKernel &&
         metric.percentageOf.empty() == (metric.source != MetricSource::KernelPercentage);
}
static_assert(std::ranges::all_of(kMeasuredMetrics, isWellFormed));
// Two rows may read one kernel value, and then with the same width.
constexpr bool agree(const MeasuredMetric& one, const MeasuredMetric& other) {
  return one.key != other.key && (one.kernelValue.empty() || one.kernelValue != other.kernelValue ||
                                  one.width == other.width);
}
static_assert(std::ranges::all_of(kMeasuredMetrics, [](const MeasuredMetric& one) {
  return std::ranges::all_of(kMeasuredMetrics, [&one](const MeasuredMetric& other) {
    return &one == &other || agree(one, other);
  });
}));

// Empty when the value cannot be read.
std::optional<std::uint64_t> readKernelNumber(KernelValues& kernel, std::string_view name,
                                              std::size_t width) {
  std::byte buffer[kLargestKernelValue] = {};
  std::size_t length = width;
  if (kernel.readKernelValue(name, {buffer, width}, &length) != 0) return std::nullopt;
  const ByteReader value(buffer);
  if (width == 4) return value.read<std::uint32_t>(0);
  return value.read<std::uint64_t>(0);
}

// A value that cannot be read is recorded as all ones in its width; one that this kind of device
// does not have is not recorded.
Measured measureKernelValue(KernelValues& kernel, const MeasuredMetric& metric) {
  if (!kernel.hasKernelValue(metric.kernelValue)) return std::nullopt;
  const std::uint64_t failed = metric.width == 4 ? UINT32_MAX : UINT64_MAX;
  return static_cast<std::int64_t>(
      readKernelNumber(kernel, metric.kernelValue, metric.width).value_or(failed));
}

// A share of 0, or of a value that cannot be read, has no meaning.
Measured measurePercentage(KernelValues& kernel, const MeasuredMetric& metric,
                           std::uint64_t total) {
  const auto count = readKernelNumber(kernel, metric.kernelValue, metric.width);
  if (!count || total == 0) return std::nullopt;
  return saturatedInt64(static_cast<double>(*count) / static_cast<double>(total) * 100);
}

// Whether the entry points of the crash-reporting support library are available.
bool loadAccessors(SystemLog& log, CrashSupportLibrary& library) {
  CrashSupportLibrary::Accessors& found = library.accessors;
  if (found.getIntegerValue && found.setValue) return true;
  if (!library.open(kCrashSupportPath)) {
    log.message(LogLevel::Error, "Failed to dynamically load the FaultDeskSupport framework");
    return false;
  }
  found.getIntegerValue = library.hasSymbol(kCrashSupportSymbols[0]);
  if (!found.getIntegerValue) {
    log.message(LogLevel::Error, "Failed to dyanmically link SMAPreferencesGetIntegerValue");
  }
  found.setValue = library.hasSymbol(kCrashSupportSymbols[1]);
  if (!found.setValue) {
    log.message(LogLevel::Error, "Failed to dynamically link SMAPreferencesSetValue");
  }
  return found.getIntegerValue && found.setValue;
}

std::int64_t measureStoreSize(Files& files) {
  const auto size = files.fileSize(kStorePath);
  return size ? static_cast<std::int64_t>(*size) / kMebibyte : -1;
}

std::int64_t takeStoreCorruptions(Platform& platform) {
  if (!loadAccessors(*platform.log, *platform.crashSupportLibrary)) return 0;
  Preferences& preferences = *platform.preferences;
  constexpr const KnownPreference& kCount = knownPreference("DatabaseCorruptionCount");
  const auto corruptions = preferences.SMAPreferencesGetIntegerValue(kCount.key, kCount.domain);
  preferences.set(kCount, KvNumber::int32(0));
  return corruptions;
}

std::int64_t measureUptime(SystemLog& log, KernelValues& kernel) {
  const auto ticks = static_cast<double>(kernel.MonotonicTicks());
  const auto timebase = kernel.TimebaseInfo();
  if (!timebase || timebase->denominator == 0) {
    log.message(LogLevel::Error, "Couldn't retrieve mach_timebase_info");
    return -1;
  }
  const double minutesPerTick = (timebase->numerator * 0.000000001) / timebase->denominator / 60.0;
  return saturatedInt64(ticks * minutesPerTick);
}

Measured measure(Platform& platform, const MeasuredMetric& metric, std::uint64_t total) {
  switch (metric.source) {
    case MetricSource::StoreSize:
      return measureStoreSize(*platform.files);
    case MetricSource::StoreCorruptions:
      return takeStoreCorruptions(platform);
    case MetricSource::Uptime:
      return measureUptime(*platform.log, *platform.kernelValues);
    case MetricSource::KernelValue:
      return measureKernelValue(*platform.kernelValues, metric);
    case MetricSource::KernelPercentage:
      return measurePercentage(*platform.kernelValues, metric, total);
    case MetricSource::AllApplications:
    case MetricSource::UserApplications:
      break;  // counted together
  }
  return std::nullopt;
}

bool countsApplications(const MeasuredMetric& metric) {
  return metric.source == MetricSource::AllApplications ||
         metric.source == MetricSource::UserApplications;
}

}  // namespace

void recordApplications(Platform& platform, LogValues& values) {
  constexpr const MeasuredMetric& kAll = metricOf(MetricSource::AllApplications);
  constexpr const MeasuredMetric& kUsers = metricOf(MetricSource::UserApplications);
  const auto* allOptions = values.scalarOptions(kAll.key);
  const auto* usersOptions = values.scalarOptions(kUsers.key);
  if (allOptions == nullptr && usersOptions == nullptr) return;
  std::int64_t all = 0, users = 0;
  platform.appRegistry->enumerateBundles(kBundleKindApplication, [&](std::string_view type) {
    ++all;
    if (type == UserAppType) ++users;
  });
  if (allOptions != nullptr) values.addScalar(all, kAll.key, *allOptions);
  if (usersOptions != nullptr) values.addScalar(users, kUsers.key, *usersOptions);
}

void recordDeviceMetrics(Platform& platform, LogValues& values) {
  // Read once for all its percentages, which follow each other in the table.
  std::string_view totalName;
  std::optional<std::uint64_t> total;
  for (const MeasuredMetric& metric : kMeasuredMetrics) {
    if (countsApplications(metric)) continue;
    if (metric.source == MetricSource::KernelPercentage) {
      if (metric.percentageOf != totalName) {
        totalName = metric.percentageOf;
        total = readKernelNumber(*platform.kernelValues, totalName, kNumberWidth);
      }
      if (!total) continue;
    }
    const auto* options = values.scalarOptions(metric.key);
    if (options == nullptr) continue;
    if (const auto measured = measure(platform, metric, total.value_or(0))) {
      values.addScalar(*measured, metric.key, *options);
    }
  }
}

bool isMeasuredByReport(std::string_view key) {
  const auto own = std::ranges::find(kOwnMetrics, key, &OwnMetricRow::key);
  if (own != std::end(kOwnMetrics)) return own->source == OwnSource::Report;
  return std::ranges::find(kMeasuredMetrics, key, &MeasuredMetric::key) !=
         std::end(kMeasuredMetrics);
}

std::vector<KernelValueName> kernelValuesOfReport() {
  std::vector<KernelValueName> names;
  for (const MetricSource source : {MetricSource::KernelValue, MetricSource::KernelPercentage}) {
    for (const MeasuredMetric& metric : kMeasuredMetrics) {
      if (metric.source == source) names.push_back({metric.kernelValue, metric.width});
    }
  }
  for (const MeasuredMetric& metric : kMeasuredMetrics) {
    const bool isNew =
        !metric.percentageOf.empty() &&
        std::ranges::find(names, metric.percentageOf, &KernelValueName::name) == names.end();
    if (isNew) names.push_back({metric.percentageOf, kNumberWidth});
  }
  return names;
}

}  // namespace tally
