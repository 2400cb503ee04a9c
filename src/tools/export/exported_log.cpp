#include "tools/export/exported_log.h"

#include <fmt/core.h>

#include <limits>

namespace tally::tools {
namespace {

// The number as a T; empty when it is not an integer, or not within a T.
template <class T>
std::optional<T> integerOf(const KvObject* value) {
  const auto* const number = kvCast<KvNumber>(value);
  if (number == nullptr || number->isReal()) return std::nullopt;
  const std::int64_t integer = number->asInt64();
  if (number->isUnsigned() && integer < 0) return std::nullopt;
  if constexpr (sizeof(T) < sizeof integer) {
    using Limits = std::numeric_limits<T>;
    if (integer < std::int64_t{Limits::min()} || integer > std::int64_t{Limits::max()}) {
      return std::nullopt;
    }
  }
  return static_cast<T>(integer);
}

std::optional<std::int32_t> dayWithDate(const DailyLog& log) {
  constexpr std::int32_t kFirst = -719162, kLast = 2932896;  // of the years 1 and 9999
  const auto day = log.day();
  return day && *day >= kFirst && *day <= kLast ? day : std::nullopt;
}

// Every bucket of a histogram; false when it is not one.
bool readHistogram(const KvObject* value, std::vector<ExportedBucket>& buckets) {
  const auto* const histogram = kvCast<KvDictionary>(value);
  if (histogram == nullptr) return false;
  for (const auto& [label, samples] : *histogram) {
    const auto bounds = parseBucketLabel(label->view());
    const auto count = integerOf<std::uint32_t>(samples.get());
    if (!bounds || !count) return false;
    buckets.push_back({*bounds, *count});
  }
  return true;
}

bool readStatistics(const KvObject* value, Statistics& statistics) {
  constexpr std::size_t kCountAt = 4;
  const auto found = statisticsOf(value);
  if (!found) return false;
  const auto count = integerOf<std::int32_t>(static_cast<const KvArray*>(value)->get(kCountAt));
  if (!count || *count < 0) return false;
  statistics = *found;
  return true;
}

}  // namespace

LogOrigin originOf(const SpooledLog& log) {
  if (!isDailyLog(log)) return {};
  LogOrigin origin{log.device, log.deviceSequence, log.systemVersion, ""};
  if (origin.sequence > kLargestExact) origin.sequence.reset();
  if (log.options) origin.configuration = log.options->getString("ConfigNumber").value_or("");
  return origin;
}

SkippedValues exportLog(const DailyLog& log, const LogOrigin& origin, RowFormat& format) {
  SkippedValues skipped;
  const auto skip = [&](std::string_view key, const char* fault) {
    if (skipped.count++ == 0) skipped.first = fmt::format("{} {}", key, fault);
  };
  const KvDictionary& document = log.document();
  format.beginLog({origin, dayWithDate(log),
                   integerOf<std::int64_t>(document.get("TBCrashLogVersion")),
                   document.getString("TBWhitelistDigest").value_or("")});
  for (const char* const part : {"TBScalars", "TBDistributions", "TBDistributionsHistogram"}) {
    if (document.contains(part) && document.getAs<KvDictionary>(part) == nullptr) {
      skip(part, "is not a dictionary");
    }
  }
  for (const auto& [key, value] : log.scalars()) {
    if (const auto integer = integerOf<std::int64_t>(value.get())) {
      format.addScalar(key->view(), *integer);
    } else {
      skip(key->view(), "is not a 64-bit integer");
    }
  }
  const KvDictionary& histograms = log.histograms();
  std::size_t unmatched = histograms.size();
  ExportedDistribution distribution;
  for (const auto& [key, value] : log.distributions()) {
    const KvObject* const histogram = histograms.get(*key);
    if (histogram != nullptr) --unmatched;
    if (!readStatistics(value.get(), distribution.statistics)) {
      skip(key->view(), "does not have the statistics of a distribution");
      continue;
    }
    distribution.histogram.clear();
    if (histogram != nullptr && !readHistogram(histogram, distribution.histogram)) {
      skip(key->view(), "does not have a histogram with bounds and counts");
      distribution.histogram.clear();
    }
    format.addDistribution(key->view(), distribution);
  }
  if (unmatched != 0) skip("a histogram", "has no distribution");
  return skipped;
}

}  // namespace tally::tools
