#include "tools/whitelist/metric_check.h"

#include <fmt/format.h>
#include <algorithm>
#include <cmath>
#include <limits>
#include <map>

#include "base/time_text.h"
#include "config/key_table.h"
#include "config/whitelist_options.h"
#include "host/linux_platform.h"
#include "host/store/store_history.h"
#include "host/store/store_schema.h"
#include "report/distribution_summary.h"
#include "tools/metrics/unit_scale.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {
namespace {

bool isOfKind(MetricType type, bool scalar) { return isScalarType(type) == scalar; }

// Those of an "intervals" option that are finite.
struct Boundaries {
  double first = std::numeric_limits<double>::infinity(), last = -first;
  bool empty() const { return first > last; }
};
Boundaries boundariesOf(const KvDictionary& options) {
  Boundaries found;
  const auto* const array = options.getAs<KvArray>(kOptionIntervals);
  for (std::size_t i = 0; array != nullptr && i < array->size(); ++i) {
    const double value = array->getAs<KvNumber>(i)->asDouble();
    if (!std::isfinite(value)) continue;
    found.first = std::min(found.first, value);
    found.last = std::max(found.last, value);
  }
  return found;
}

class MetricChecker final : public WhitelistVisitor {
 public:
  explicit MetricChecker(const KnownMetrics& metrics) : metrics_(metrics) {}
  std::vector<Finding> findings;

  bool beginGroup(std::string_view name) override {
    endGroup();
    group_ = name;
    return true;
  }
  void malformed(const WhitelistPlace&) override {}
  void entry(WhitelistSection section, const WhitelistEntry& entry) override {
    const std::string_view key = entry.key;
    if (!key.empty() && !isStoreKey(key)) return;  // said already
    if (!key.empty()) {
      isPrefixSection(section) ? checkPrefix(section, entry) : checkKey(section, entry);
    }
    if (isScalarSection(section)) return;
    (isPrefixSection(section) ? prefixes_ : keys_).set(entry);
  }

  // After the last entry.
  void finish(const ToolContext& context) {
    endGroup();
    checkStore(context);
  }

 private:
  struct Measured {
    const WhitelistEntry* entry;
    bool isPrefix;
    const Metric* metric;
    Boundaries boundaries;
    SampleRange samples = {};
  };

  // On which a key was recorded as each kind.
  struct LastDays {
    std::optional<std::int32_t> scalar, distribution;
  };

  // A table that leaves out much is one remark for each group.
  void endGroup() {
    constexpr std::size_t kNamed = 3;
    if (haveTables() && !undescribed_.empty()) {
      const std::size_t count = undescribed_.size();
      undescribed_.resize(std::min(count, kNamed));
      findings.push_back(
          {Severity::Surprise, group_, "", "", "",
           fmt::format("{} that no metrics table describes: {}{}", counted(count, "entry"),
                       fmt::join(undescribed_, ", "), count > kNamed ? ", …" : "")});
    }
    undescribed_.clear();
  }

  bool haveTables() const { return !metrics_.ofDevice().empty(); }

  void add(Severity severity, WhitelistSection section, const WhitelistEntry& entry,
           std::string_view option, std::string message) {
    findings.push_back({severity, std::string(entry.group), std::string(sectionName(section)),
                        std::string(entry.key), std::string(option), std::move(message)});
  }

  void addContradiction(WhitelistSection section, const WhitelistEntry& entry,
                        const Metric& metric) {
    const bool histogram = !isScalarSection(section) && entry.options->contains(kOptionIntervals);
    add(Severity::Fault, section, entry, histogram ? kOptionIntervals : std::string_view(),
        fmt::format("{} calls it a {}, which {}", metric.source, nameOf(*metric.type),
                    isScalarSection(section) ? "is not reported as a scalar"
                    : histogram              ? "has no histogram"
                                             : "is not reported as a distribution"));
  }

  void checkKey(WhitelistSection section, const WhitelistEntry& entry) {
    const Metric* const metric = metrics_.find(entry.key);
    if (metric == nullptr) {
      undescribed_.emplace_back(entry.key);
    } else if (metric->type && !isOfKind(*metric->type, isScalarSection(section))) {
      addContradiction(section, entry, *metric);
    }
  }

  void checkPrefix(WhitelistSection section, const WhitelistEntry& entry) {
    const std::string_view prefix = entry.key;
    const bool scalar = isScalarSection(section);
    const Metric* const around = metrics_.prefixOf(prefix);
    const MetricTable::Below below = metrics_.below(prefix);
    if (around == nullptr) {
      if (below.metrics == 0) undescribed_.emplace_back(prefix);
    } else if (around->type && !isOfKind(*around->type, scalar) &&
               (scalar ? below.scalars : below.distributions) == 0) {
      addContradiction(section, entry, *around);
    }
  }

  void checkStore(const ToolContext& context);
  void checkTypes(std::string_view key, const LastDays& recorded);
  void measureLater(std::string_view key);
  void checkBoundaries(Platform& platform);

  const KnownMetrics& metrics_;
  std::string group_;
  std::vector<std::string> undescribed_;      // entries of the group
  KeyTable<WhitelistEntry> keys_, prefixes_;  // of distributions
  std::map<std::string, Measured, std::less<>> measured_;
};

void MetricChecker::checkTypes(std::string_view key, const LastDays& recorded) {
  const Metric* const metric = metrics_.find(key);
  const bool isTyped = metric != nullptr && metric->type;
  std::string message;
  if (recorded.scalar && recorded.distribution) {
    message = fmt::format(
        "recorded as two types: as a scalar, last on {}, and as a distribution, last on {}",
        dayText(*recorded.scalar), dayText(*recorded.distribution));
  } else if (isTyped && !isOfKind(*metric->type, recorded.scalar.has_value())) {
    message = recorded.scalar
                  ? fmt::format("recorded as a scalar, last on {}", dayText(*recorded.scalar))
                  : fmt::format("recorded as a distribution, last on {}",
                                dayText(*recorded.distribution));
  } else {
    return;
  }
  if (isTyped) message += fmt::format("; {} calls it a {}", metric->source, nameOf(*metric->type));
  findings.push_back({Severity::Surprise, "", "", std::string(key), "", std::move(message)});
}

// Remembers a key whose boundaries its samples may contradict.
void MetricChecker::measureLater(std::string_view key) {
  const WhitelistEntry* entry = keys_.exact(key);
  const bool isPrefix = entry == nullptr;
  if (isPrefix) entry = prefixes_.longestPrefix(key);
  const Metric* const metric = metrics_.find(key);
  if (entry == nullptr || metric == nullptr || unitScale(metric->unit) == nullptr) return;
  const Boundaries boundaries = boundariesOf(*entry->options);
  if (boundaries.empty()) return;
  measured_.try_emplace(std::string(key), Measured{entry, isPrefix, metric, boundaries});
}

void MetricChecker::checkBoundaries(Platform& platform) {
  if (measured_.empty()) return;
  const auto noOptions = ScalarOptions::create();
  platform.metricsStore->openHistory()->enumerateDistributions(
      "", std::numeric_limits<std::int32_t>::min(), std::numeric_limits<std::int32_t>::max(),
      [&](std::string_view key, std::int32_t, DistributionValues& values, bool&) {
        const auto found = measured_.find(key);
        if (found == measured_.end()) return;
        const auto day = summariseDistribution(*platform.log, values, key, *noOptions).summary;
        SampleRange& range = found->second.samples;
        if (day.count == 0 || !std::isfinite(day.mean)) return;
        range.minimum = range.count == 0 ? day.minimum : std::min(range.minimum, day.minimum);
        range.maximum = range.count == 0 ? day.maximum : std::max(range.maximum, day.maximum);
        range.count += day.count;
        range.mean += (day.mean - range.mean) * static_cast<double>(day.count) /
                      static_cast<double>(range.count);
      });
  for (const auto& [key, item] : measured_) {
    const UnitScale* const meant = likelierUnit(
        *unitScale(item.metric->unit), item.boundaries.first, item.boundaries.last, item.samples);
    if (meant == nullptr) continue;
    const auto section = item.isPrefix ? WhitelistSection::DistributionKeyPrefixes
                                       : WhitelistSection::DistributionKeys;
    const bool above = item.samples.minimum > item.boundaries.last;
    add(Severity::Surprise, section, *item.entry, kOptionIntervals,
        fmt::format("all {} of {}, from {} to {} {}, are {} boundary, {}; the boundaries may be in "
                    "{}",
                    counted(static_cast<std::uint64_t>(item.samples.count), "sample"), key,
                    realText(item.samples.minimum), realText(item.samples.maximum),
                    item.metric->unit, above ? "above the last" : "within the first",
                    realText(above ? item.boundaries.last : item.boundaries.first), meant->name));
  }
}

void MetricChecker::checkStore(const ToolContext& context) {
  prefixes_.buildPrefixIndex();
  std::map<std::string, LastDays> recorded;
  listStoreKeys(
      metricsStoreFile(context.root),
      [&](const StoreKey& key) {
        const bool scalar = key.kind == StoreKey::Kind::Scalar;
        LastDays& days = recorded[std::string(key.key)];
        (scalar ? days.scalar : days.distribution) = static_cast<std::int32_t>(key.lastDay);
        if (!scalar) measureLater(key.key);
      },
      [this](const std::string& message) {
        findings.push_back({Severity::Surprise, "", "", "", "", message});
      });
  for (const auto& [key, days] : recorded) checkTypes(key, days);
  checkBoundaries(*context.platform);
}

}  // namespace

std::vector<Finding> checkMetrics(const ToolContext& context, const KnownMetrics& metrics,
                                  const WhitelistContent& whitelist) {
  MetricChecker checker(metrics);
  visitWhitelist(whitelist, checker);
  checker.finish(context);
  return std::move(checker.findings);
}

}  // namespace tally::tools
