// Tables of the documents, as the tables of the code make them. A table that differs is shown
// whole, to be copied into the document.
#include <gtest/gtest.h>

#include <fmt/format.h>

#include <cmath>

#include "config/whitelist_options.h"
#include "document_table.h"
#include "platform/tables/known_preferences.h"
#include "platform/tables/measured_metrics.h"
#include "platform/tables/own_metrics.h"

namespace tally {
namespace {

std::string typeText(const KnownPreference& known) {
  constexpr const char* kNames[] = {"boolean", "integer", "real",       "string",
                                    "date",    "array",   "dictionary", "any"};
  std::string text = kNames[static_cast<int>(known.type)];
  if (std::isfinite(known.bound.above)) text += fmt::format(" above {}", known.bound.above);
  if (std::isfinite(known.bound.below)) text += fmt::format(", below {}", known.bound.below);
  return text;
}

TEST(DocumentTables, Preferences) {
  std::string table = "| domain | key | type | meaning | default |\n|---|---|---|---|---|\n";
  std::string_view domain;
  for (const KnownPreference& known : kKnownPreferences) {
    const bool isNumber =
        known.type == PreferenceType::Integer || known.type == PreferenceType::Real;
    table += fmt::format(
        "|{} | {} | {} | {} | {} |\n",
        known.domain == domain ? std::string() : fmt::format(" `{}`", known.domain),
        known.key.empty() ? "a whitelist group's name" : fmt::format("`{}`", known.key),
        typeText(known), known.meaning,
        isNumber ? fmt::format("{}", known.bound.fallback) : std::string(known.without));
    domain = known.domain;
  }
  expectInDocument("device-root.md", table);
}

std::string sourceText(const MeasuredMetric& metric) {
  switch (metric.source) {
    case MetricSource::AllApplications:
      return "installed applications";
    case MetricSource::UserApplications:
      return "installed applications of the user";
    case MetricSource::StoreSize:
      return "size of the metrics store's file";
    case MetricSource::StoreCorruptions:
      return "preference `DatabaseCorruptionCount`";
    case MetricSource::Uptime:
      return "ticks since boot";
    case MetricSource::KernelValue:
      return fmt::format("`{}`, {} bytes", metric.kernelValue, metric.width);
    case MetricSource::KernelPercentage:
      return fmt::format("`{}`, {} bytes, of `{}`", metric.kernelValue, metric.width,
                         metric.percentageOf);
  }
  return "";
}

TEST(DocumentTables, MeasuredMetrics) {
  std::string table = "| key | measured from | unit | meaning |\n|---|---|---|---|\n";
  for (const MeasuredMetric& metric : kMeasuredMetrics) {
    table += fmt::format("| `{}` | {} | {} | {} |\n", metric.key, sourceText(metric), metric.unit,
                         metric.meaning);
  }
  expectInDocument("device-root.md", table);
}

TEST(DocumentTables, OwnMetrics) {
  constexpr const char* kOf[] = {"run to run", "the day", "the day", "the run"};
  std::string table = "| key | of | unit | meaning |\n|---|---|---|---|\n";
  for (const OwnMetricRow& row : kOwnMetrics) {
    table += fmt::format("| `{}` | {} | {} | {} |\n", row.key, kOf[std::size_t(row.source)],
                         row.unit.empty() ? "-" : row.unit, row.meaning);
  }
  expectInDocument("own-figures.md", table);
}

TEST(DocumentTables, WhitelistOptions) {
  std::string table =
      "| option | effect |\n|---|---|\n"
      "| none (an empty dictionary) | the value is reported as it is |\n";
  for (const WhitelistOption& option : whitelistOptions()) {
    table += fmt::format("| `{}` | {} |\n", option.name, option.meaning);
  }
  expectInDocument("integrating.md", table);
}

}  // namespace
}  // namespace tally
