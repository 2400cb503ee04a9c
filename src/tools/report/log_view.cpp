#include "tools/report/log_view.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "base/natural_order.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

std::string numberText(const KvObject* value) {
  const auto* number = kvCast<KvNumber>(value);
  if (number == nullptr) return valueText(value);
  return number->isReal() ? realText(number->asDouble()) : integerText(number->asInt64());
}

void printHeader(const ToolContext& context, const DailyLog& log, const KvDictionary* options) {
  const KvDictionary& document = log.document();
  Table table({{""}, {"", Align::Left, true}});
  const auto add = [&](const char* name, std::string text) {
    table.add({Cell(name, Ink::Faint), std::move(text)});
  };
  add("created", valueText(document.get("TBLogCreationDate")));
  const auto& metadata = log.metadata();
  const auto text = [&](std::string_view key) { return valueText(metadata.get(key)); };
  if (!metadata.empty()) {
    add("language", fmt::format("{}, preferred {}", text("TBUserInterfaceLanguage"),
                                text("TBPreferredUserInterfaceLanguage")));
    add("region",
        metadata.contains("TBUserSetRegionFormat") ? text("TBUserSetRegionFormat") : "not known");
  }
  add("tasking", valueText(document.get("TBTaskID")));
  add("tasking digest", valueText(document.get("TBTaskDigest")));
  add("tasking payload", valueText(document.get("TBTasking")));
  add("whitelist digest", valueText(document.get("TBWhitelistDigest")));
  if (options != nullptr) {
    for (const auto& option : *options) {
      table.add({Cell(std::string(option.key->view()), Ink::Faint), valueText(option.value.get())});
    }
  }
  table.print(context);
}

// A column of units for these keys, if any of them has one.
Table tableWithUnits(std::vector<Column> columns, const KvDictionary& keys,
                     const KnownMetrics& metrics) {
  const bool areKnown = std::any_of(keys.begin(), keys.end(), [&](const KvDictionary::Entry& key) {
    const Metric* const metric = metrics.find(key.key->view());
    return metric != nullptr && !metric->unit.empty();
  });
  if (areKnown) columns.push_back({"unit"});
  return Table(std::move(columns));
}

// A row that ends with the metric's unit, and its description below it; that of a prefix only below
// the first of the rows that it describes.
void addWithMetric(Table& table, std::vector<Cell> row, const Metric* metric,
                   const Metric*& former) {
  if (metric != nullptr && !metric->unit.empty()) row.emplace_back(metric->unit, Ink::Faint);
  table.add(std::move(row));
  if (metric != nullptr && metric != former && !metric->description.empty()) {
    table.addNote(metric->description);
  }
  former = metric;
}

void printScalars(const ToolContext& context, const DailyLog& log, const KnownMetrics& metrics) {
  printHeading(context, "Scalars, " + counted(log.scalars().size(), "key"));
  Table table =
      tableWithUnits({{"key", Align::Left, true}, {"value", Align::Right}}, log.scalars(), metrics);
  const Metric* former = nullptr;
  for (const auto* entry : entriesByName(log.scalars())) {
    const std::string_view key = entry->key->view();
    addWithMetric(table, {std::string(key), numberText(entry->value.get())}, metrics.find(key),
                  former);
  }
  if (!table.empty()) table.print(context);
}

void printDistributions(const ToolContext& context, const DailyLog& log,
                        const KnownMetrics& metrics) {
  printHeading(context, "Distributions, " + counted(log.distributions().size(), "key"));
  Table table = tableWithUnits({{"key", Align::Left, true},
                                {"count", Align::Right},
                                {"min", Align::Right},
                                {"mean", Align::Right},
                                {"std dev", Align::Right},
                                {"max", Align::Right}},
                               log.distributions(), metrics);
  const Metric* former = nullptr;
  for (const auto* entry : entriesByName(log.distributions())) {
    const std::string key(entry->key->view());
    if (const auto statistics = statisticsOf(entry->value.get())) {
      addWithMetric(table,
                    {key, integerText(statistics->count), realText(statistics->minimum),
                     realText(statistics->mean), realText(statistics->standardDeviation()),
                     realText(statistics->maximum)},
                    metrics.find(key), former);
    } else {
      table.add({key, Cell("damaged", Ink::Bad)});
    }
  }
  if (!table.empty()) table.print(context);
}

void printApplications(const ToolContext& context, const DailyLog& log) {
  const auto* applications = log.document().getAs<KvArray>("TBActivatedAppInfo");
  if (applications == nullptr) return;
  printHeading(context, "Activated applications, " + counted(applications->size(), "entry"));
  Table table({{"bundle", Align::Left, true},
               {"version"},
               {"adamID", Align::Right},
               {"arch"},
               {"uuid", Align::Left, true}});
  for (const auto& item : *applications) {
    const auto* application = kvCast<KvDictionary>(item.get());
    if (application == nullptr) continue;
    std::vector<Cell> row;
    for (const char* field : {"bundle", "version", "adamID", "arch", "uuid"}) {
      const KvObject* value = application->get(field);
      row.push_back(value != nullptr ? kvText(value) : "-");
    }
    table.add(std::move(row));
  }
  if (!table.empty()) table.print(context);
}

}  // namespace

std::string valueText(const KvObject* value) {
  if (value == nullptr) return "absent";
  switch (value->type()) {
    case KvType::Array:
      return counted(static_cast<const KvArray*>(value)->size(), "item");
    case KvType::Dictionary:
      return counted(static_cast<const KvDictionary*>(value)->size(), "key");
    case KvType::Data:
      return counted(static_cast<const KvData*>(value)->bytes().size(), "byte");
    case KvType::Boolean:
      return static_cast<const KvBoolean*>(value)->value() ? "true" : "false";
    case KvType::Date: {
      std::string text;
      appendTimestamp(text, static_cast<const KvDate*>(value)->secondsSince1970());
      return text;
    }
    default:
      return kvText(value);
  }
}

void printHistogram(const ToolContext& context, const KvDictionary& histogram, std::size_t indent) {
  constexpr std::size_t kBarWidth = 36;
  double total = 0;
  double most = 0;
  for (const auto& bucket : histogram) {
    const auto* count = kvCast<KvNumber>(bucket.value.get());
    total += count != nullptr ? count->asDouble() : 0;
    most = std::max(most, count != nullptr ? count->asDouble() : 0);
  }
  Table table({{"", Align::Right}, {"", Align::Right}, {"", Align::Right}, {""}});
  for (const auto& bucket : histogram) {
    const auto* count = kvCast<KvNumber>(bucket.value.get());
    const double samples = count != nullptr ? count->asDouble() : 0;
    table.add({std::string(bucket.key->view()), numberText(bucket.value.get()),
               total > 0 ? fmt::format("{:.1f} %", samples / total * 100) : "",
               Cell::bar(most > 0 ? samples / most : 0, kBarWidth)});
  }
  print(context.out, table.render(context.output, indent));
}

void printDailyLog(const ToolContext& context, const DailyLog& log, const KvDictionary* options,
                   const KnownMetrics& metrics) {
  const auto day = log.day();
  printLine(context, "Daily log of " + (day ? dayName(*day) : std::string("an unknown day")),
            Ink::Strong);
  printHeader(context, log, options);
  printScalars(context, log, metrics);
  printDistributions(context, log, metrics);
  printHeading(context, "Histograms, " + counted(log.histograms().size(), "key"));
  for (const auto* entry : entriesByName(log.histograms())) {
    const auto* histogram = kvCast<KvDictionary>(entry->value.get());
    const Metric* const metric = metrics.find(entry->key->view());
    std::string title = "  " + std::string(entry->key->view());
    if (metric != nullptr && !metric->unit.empty()) title += ", in " + metric->unit;
    printLine(context, title);
    if (histogram != nullptr) {
      printHistogram(context, *histogram, 4);
    } else {
      printLine(context, "    damaged", Ink::Bad);
    }
  }
  printApplications(context, log);
}

Json jsonOf(const DailyLog& log, const KvDictionary* options, const KnownMetrics& metrics) {
  Json deviations = Json::object();
  for (const auto& entry : log.distributions()) {
    if (const auto statistics = statisticsOf(entry.value.get())) {
      addMember(deviations, std::string(entry.key->view()),
                jsonOfReal(statistics->standardDeviation()));
    }
  }
  Json json = {{"document", jsonOf(&log.document())}, {"standardDeviations", deviations}};
  if (const auto day = log.day()) json["day"] = *day;
  json["options"] = jsonOf(options);
  Json known = Json::object();
  for (const KvDictionary* part : {&log.scalars(), &log.distributions()}) {
    for (const auto& entry : *part) {
      const Metric* const metric = metrics.find(entry.key->view());
      const bool isSecond = part != &log.scalars() && log.scalars().contains(entry.key->view());
      if (metric != nullptr && !isSecond) {
        addMember(known, std::string(entry.key->view()), jsonOf(*metric));
      }
    }
  }
  if (!known.empty()) json["metrics"] = std::move(known);
  return json;
}

}  // namespace tally::tools
