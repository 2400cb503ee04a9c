#include "tools/metrics/known_metrics.h"

#include <fmt/format.h>
#include <cstdint>
#include <map>
#include <nlohmann/json.hpp>
#include <optional>
#include <utility>

#include "host/kernel/channel_table.h"
#include "hwreport/hwreport.h"
#include "platform/tables/measured_metrics.h"
#include "platform/tables/own_metrics.h"
#include "platform/tables/swept_metrics.h"
#include "recorder/refusal.h"
#include "storage/nand_info/figure_texts.h"

namespace tally::tools {
namespace {

constexpr std::string_view kChannelKeys = "vellum.hwreport.";

// As legends label it.
std::string labelOf(std::uint64_t unit) {
  const auto collection = HwReportCreateAggregate(0);
  std::string label;
  HwReportAddChannelDescription(collection.get(), 1, KvString::create("channel").get(), 1, 1,
                                nullptr, nullptr, nullptr, HwReportCreateUnitInfo(unit).get(),
                                nullptr);
  HwReportIterate(collection.get(), [&label](KvDictionary* channel) {
    label = HwReportChannelGetUnitLabel(channel)->view();
    return HwIterContinue;
  });
  return label;
}

void addOwn(MetricTable& table, std::string_view key, std::optional<MetricType> type,
            std::string_view unit, std::string_view meaning, bool isPrefix = false) {
  table.add({KvString::create(key), type, std::string(unit), std::string(meaning), "the system"},
            isPrefix);
}

void addChannels(MetricTable& table) {
  std::map<std::uint64_t, std::string> labels;
  for (const ChannelRow& row : kChannelTable) {
    if (row.daily.empty()) continue;
    const auto [label, isNew] = labels.try_emplace(row.unit);
    if (isNew) label->second = labelOf(row.unit);
    const std::string key = std::string(kChannelKeys).append(row.daily);
    std::string meaning(row.description);
    const Metric* const present = table.exact(key);  // to which this channel is added
    if (present != nullptr && present->description != meaning) {
      meaning = present->description + ", and " + meaning;
    }
    addOwn(table, key, isCounter(row.semantics) ? MetricType::Counter : MetricType::Gauge,
           label->second, meaning);
  }
}

bool isDigit(char c) { return c >= '0' && c <= '9'; }

// The key, or the beginning of one, of a daily channel as the table has it: "#" for the number at
// the end of its first part, or "%" for its second part. Empty if it is none.
std::string channelPattern(std::string_view key, char mark) {
  if (!key.starts_with(kChannelKeys)) return "";
  const auto end = key.find('.', kChannelKeys.size());
  if (end == std::string_view::npos) return "";
  if (mark == '#') {
    std::size_t begin = end;
    while (begin > kChannelKeys.size() && isDigit(key[begin - 1])) --begin;
    return begin == end ? "" : fmt::format("{}#{}", key.substr(0, begin), key.substr(end));
  }
  const auto next = key.find('.', end + 1);
  if (next == std::string_view::npos) return "";
  return fmt::format("{}%{}", key.substr(0, end + 1), key.substr(next));
}

}  // namespace

KnownMetrics::KnownMetrics(MetricTable ofDevice) : device_(std::move(ofDevice)) {
  for (const MeasuredMetric& metric : kMeasuredMetrics) {
    addOwn(system_, metric.key, MetricType::Gauge, metric.unit, metric.meaning);
  }
  for (const SweptMetric& metric : {kDiskCapacity, kDiskFree}) {
    addOwn(system_, metric.key, MetricType::Gauge, metric.unit, metric.meaning);
  }
  addOwn(system_, kStorageFigures.key, std::nullopt, kStorageFigures.unit, kStorageFigures.meaning,
         /*isPrefix=*/true);
  eachFigureText([this](const FigureText& figure) {
    addOwn(system_, figure.key, MetricType::Gauge, figure.unit, figure.meaning);
  });
  addChannels(system_);
  for (const RefusalRow& row : kRefusals) {
    addOwn(system_, row.key, MetricType::Counter, "refusals", row.meaning);
  }
  for (const RefusalRow& row : kRecorderCounts) {
    addOwn(system_, row.key, MetricType::Counter, "", row.meaning);
  }
  for (const OwnMetricRow& row : kOwnMetrics) {
    addOwn(system_, row.key, MetricType::Gauge, row.unit, row.meaning);
  }
  system_.finish();
}

const Metric* KnownMetrics::find(std::string_view key) const {
  const Metric* metric = device_.exact(key);
  if (metric == nullptr) metric = system_.exact(key);
  for (const char mark : {'#', '%'}) {
    if (metric == nullptr) metric = system_.exact(channelPattern(key, mark));
  }
  return metric != nullptr ? metric : prefixOf(key);
}

const Metric* KnownMetrics::prefixOf(std::string_view key) const {
  const Metric* const metric = device_.prefixOf(key);
  return metric != nullptr ? metric : system_.prefixOf(key);
}

MetricTable::Below KnownMetrics::below(std::string_view prefix) const {
  MetricTable::Below sum = device_.below(prefix);
  const auto add = [&sum](const MetricTable::Below& part) {
    sum.metrics += part.metrics;
    sum.scalars += part.scalars;
    sum.distributions += part.distributions;
  };
  add(system_.below(prefix));
  for (const char mark : {'#', '%'}) {
    const std::string pattern = channelPattern(prefix, mark);
    if (!pattern.empty()) add(system_.below(pattern));
  }
  return sum;
}

KnownMetrics knownMetrics(const ToolContext& context) {
  SystemLog& log = *context.platform->log;
  return KnownMetrics(MetricTable::load(context.root, [&log](const std::string& message) {
    log.fault("metrics table", "{}", message);
  }));
}

std::string metricText(const Metric& metric) {
  std::string text(metric.type ? nameOf(*metric.type) : "");
  if (!metric.unit.empty()) text.append(text.empty() ? "" : ", ").append("in ").append(metric.unit);
  if (!metric.description.empty()) text.append(text.empty() ? "" : ": ").append(metric.description);
  return text;
}

std::string withUnit(std::string number, const Metric* metric) {
  if (metric != nullptr && !metric->unit.empty()) number.append(" ").append(metric->unit);
  return number;
}

Json jsonOf(const Metric& metric) {
  const auto textOrNull = [](std::string_view text) {
    return text.empty() ? Json(nullptr) : Json(text);
  };
  return {{"type", metric.type ? Json(nameOf(*metric.type)) : Json(nullptr)},
          {"unit", textOrNull(metric.unit)},
          {"description", textOrNull(metric.description)}};
}

}  // namespace tally::tools
