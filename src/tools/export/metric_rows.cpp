#include "tools/export/metric_rows.h"

#include <fmt/core.h>

#include <bit>
#include <cmath>
#include <limits>

#include "base/number_text.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "tools/frame/output.h"

namespace tally::tools {

// In the order of the output; the rows of kFamilies.
enum class MetricRows::Family : std::uint8_t {
  Information,
  Start,
  Scalar,
  Samples,
  Minimum,
  Maximum,
  Mean,
  SquaredDeviations,
  Bucket
};

namespace {

struct FamilyText {
  std::string_view name, help;
};
constexpr FamilyText kFamilies[] = {
    {"tallyrun_log_info", "What is known of the log, in labels; always 1."},
    {"tallyrun_log_start_timestamp_seconds", "The start of the day that the log reports."},
    {"tallyrun_scalar", "A scalar of the day, rounded as the whitelist says."},
    {"tallyrun_distribution_samples", "The samples of a distribution of the day."},
    {"tallyrun_distribution_minimum", "The least sample of the day."},
    {"tallyrun_distribution_maximum", "The largest sample of the day."},
    {"tallyrun_distribution_mean", "The mean of the samples of the day."},
    {"tallyrun_distribution_squared_deviations",
     "The sum of the squared deviations of the samples from their mean."},
    {"tallyrun_distribution_bucket", "The samples of the day that are at most le."},
};

constexpr double kInfinity = std::numeric_limits<double>::infinity();

std::string metricNumber(double value) {
  std::string text;
  if (std::isnan(value)) return "NaN";
  if (std::isinf(value)) return value > 0 ? "+Inf" : "-Inf";
  appendDouble(text, value);
  return text;
}

// The same value has one text: "10.0", "1e+22".
std::string bucketLimit(double value) {
  std::string text = metricNumber(value);
  if (std::isfinite(value) && text.find_first_of(".e") == std::string::npos) text += ".0";
  return text;
}

// Eight bytes whose order is that of the numbers.
void appendOrdered(std::string& out, double value) {
  constexpr std::uint64_t kSign = std::uint64_t{1} << 63;
  auto bits = std::bit_cast<std::uint64_t>(value);
  bits = (bits & kSign) != 0 ? ~bits : bits | kSign;
  for (int shift = 56; shift >= 0; shift -= 8) out += static_cast<char>(bits >> shift);
}

void appendHeader(std::string& out, const FamilyText& family) {
  out.append("# TYPE ").append(family.name).append(" gauge\n# HELP ").append(family.name);
  out.append(" ").append(family.help) += '\n';
}

bool isAscending(const std::vector<ExportedBucket>& histogram) {
  double last = -kInfinity;
  for (const auto& [bounds, count] : histogram) {
    if (!(bounds.lower >= last) || !(bounds.upper > bounds.lower)) return false;
    last = bounds.upper;
  }
  return true;
}

}  // namespace

void MetricRows::appendLabel(std::string& labels, const char* name, std::string_view value) const {
  if (value.empty()) return;
  labels.append(labels.empty() ? "" : ",").append(name).append("=\"");
  for (const char c : forPerson_ ? printable(value) : std::string(value)) {
    if (c == '\n') {
      labels += "\\n";
    } else if (c == '\0') {
      labels += "\xEF\xBF\xBD";
    } else {
      if (c == '"' || c == '\\') labels += '\\';
      labels += c;
    }
  }
  labels += '"';
}

std::string MetricRows::labelsOf(std::string_view key, bool withUnit) const {
  std::string labels = device_;
  appendLabel(labels, "key", key);
  const Metric* const metric = withUnit ? metrics_.find(key) : nullptr;
  if (metric != nullptr) appendLabel(labels, "unit", metric->unit);
  return labels;
}

void MetricRows::beginLog(const LogHead& head) {
  if (!withTimes_) {
    lines_.clear();
    disorderedHistograms_ = 0;
  }
  time_.reset();
  isLeftOut_ = withTimes_ && !head.day;
  if (isLeftOut_) {
    ++logsWithoutDay_;
    return;
  }
  const std::int64_t start = std::int64_t{head.day.value_or(0)} * kSecondsPerDay;
  if (withTimes_) time_ = start + kSecondsPerDay - 1;
  device_.clear();
  appendLabel(device_, "device", head.origin.device);
  std::string labels = device_;
  if (head.origin.sequence) {
    appendLabel(labels, "sequence", std::to_string(*head.origin.sequence));
  }
  if (head.day) appendLabel(labels, "date", dayText(*head.day));
  appendLabel(labels, "system_version", head.origin.systemVersion);
  appendLabel(labels, "configuration", head.origin.configuration);
  appendLabel(labels, "whitelist", head.whitelist);
  addSample(Family::Information, labels, "1");
  if (head.day) addSample(Family::Start, device_, std::to_string(start));
}

void MetricRows::addSample(Family family, const std::string& labels, std::string_view value) {
  if (sortKey_.empty()) {
    sortKey_ += static_cast<char>(family);
    sortKey_ += labels;
  }
  line_.append(kFamilies[static_cast<std::size_t>(family)].name);
  if (!labels.empty()) line_.append("{").append(labels) += '}';
  line_.append(" ").append(value);
  if (time_) {
    appendOrdered(sortKey_, static_cast<double>(*time_));
    line_ += ' ';
    appendInt64(line_, *time_);
  }
  line_ += '\n';
  lines_.add(sortKey_, line_);
  sortKey_.clear();
  line_.clear();
}

void MetricRows::addScalar(std::string_view key, std::int64_t value) {
  if (isLeftOut_) return;
  addSample(Family::Scalar, labelsOf(key, true), std::to_string(value));
}

void MetricRows::addBucket(const std::string& labels, double limit, std::uint64_t samples) {
  sortKey_ += static_cast<char>(Family::Bucket);
  sortKey_ += labels;
  appendOrdered(sortKey_, limit);
  addSample(Family::Bucket, labels + ",le=\"" + bucketLimit(limit) + '"', std::to_string(samples));
}

// Each bound of a bucket is a limit, also the lower one of a bucket whose neighbour has no samples.
void MetricRows::addBuckets(const std::string& labels,
                            const std::vector<ExportedBucket>& histogram) {
  std::uint64_t samples = 0;
  double last = -kInfinity;
  for (const auto& [bounds, count] : histogram) {
    if (bounds.lower > last) addBucket(labels, bounds.lower, samples);
    samples += count;
    addBucket(labels, bounds.upper, samples);
    last = bounds.upper;
  }
  if (last < kInfinity) addBucket(labels, kInfinity, samples);
}

void MetricRows::addDistribution(std::string_view key, const ExportedDistribution& values) {
  if (isLeftOut_) return;
  const std::string labels = labelsOf(key, true), plain = labelsOf(key, false);
  const Statistics& statistics = values.statistics;
  addSample(Family::Samples, plain, std::to_string(statistics.count));
  addSample(Family::Minimum, labels, metricNumber(statistics.minimum));
  addSample(Family::Maximum, labels, metricNumber(statistics.maximum));
  addSample(Family::Mean, labels, metricNumber(statistics.mean));
  addSample(Family::SquaredDeviations, plain, metricNumber(statistics.squaredDeviations));
  if (values.histogram.empty()) return;
  if (isAscending(values.histogram)) {
    addBuckets(labels, values.histogram);
  } else {
    ++disorderedHistograms_;
  }
}

Status MetricRows::finish() {
  int family = -1;
  std::string lastKey, lastLine;  // of several samples with one key the last one is written
  const auto write = [&] {
    if (lastLine.empty()) return;
    std::string& text = output_.text();
    const int ofKey = static_cast<unsigned char>(lastKey.front());
    if (family != ofKey) {
      family = ofKey;
      appendHeader(text, kFamilies[family]);
    }
    text += lastLine;
  };
  const Status sorted = lines_.each([&](std::string_view key, std::string_view line) {
    if (key != lastKey) write();
    lastKey = key;
    lastLine = line;
  });
  if (!sorted) return sorted;  // without its end the output is not taken for whole
  write();
  output_.text() += "# EOF\n";
  if (logsWithoutDay_ != 0) {
    return Error{counted(logsWithoutDay_, "log") + " without a day, and so without a time"};
  }
  if (disorderedHistograms_ != 0) {
    return Error{counted(disorderedHistograms_, "histogram") +
                 " without a bound, or with bounds that do not ascend"};
  }
  return Done{};
}

}  // namespace tally::tools
