#include "tools/storage/nand_list_commands.h"

#include <algorithm>
#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "base/number_text.h"
#include "base/text_lines.h"
#include "base/time_text.h"
#include "platform/tables/known_preferences.h"
#include "storage/lists/defects_list.h"
#include "storage/lists/log_writer.h"
#include "storage/lists/storage_lists.h"
#include "storage/lists/storage_log.h"
#include "storage/lists/telemetry_list.h"
#include "storage/lists/validity_list.h"
#include "storage/lists/write_amplification.h"
#include "storage/storage_log.h"
#include "tools/frame/command.h"
#include "tools/frame/dry_run.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"
#include "tools/storage/nand_command.h"

namespace tally::tools {
namespace {

// The driver's messages are on standard error already.
int complainOfList(const ToolContext& context, std::string_view list) {
  return complain(context, fmt::format("the {} cannot be read whole", list), kWrong);
}

// Numbered elements as one value: {"stage[0]": 1, "stage[1]": 2} is {"stage": [1, 2]}.
KvRef<KvDictionary> gathered(const KvDictionary& record) {
  auto families = KvDictionary::create();
  for (const auto& [key, value] : record) {
    const std::size_t bracket = key->view().find('[');
    if (bracket == std::string_view::npos) {
      families->set(key, value);
      continue;
    }
    const std::string_view name = key->view().substr(0, bracket);
    if (!families->contains(name)) families->set(name, KvArray::create());
    families->getAs<KvArray>(name)->append(value);
  }
  return families;
}

std::string valuesText(const KvObject* value) {
  const auto* const array = kvCast<KvArray>(value);
  if (array == nullptr) return kvText(value);
  std::string text;
  for (const auto& element : *array) {
    text.append(text.empty() ? "" : " ").append(kvText(element.get()));
  }
  return text;
}

void printRecord(const ToolContext& context, const KvDictionary& families) {
  Table table({{""}, {"", Align::Left, true}});
  for (const auto& [name, value] : families) {
    const auto* const array = kvCast<KvArray>(value.get());
    table.add({array == nullptr ? std::string(name->view())
                                : fmt::format("{}[0-{}]", name->view(), array->size() - 1),
               valuesText(value.get())});
  }
  table.print(context);
}

struct TelemetryMode {
  std::uint32_t mode;
  std::vector<KvRef<KvDictionary>> buses;
};

// False when a list could not be read whole.
bool gatherTelemetry(const ToolContext& context, std::optional<std::uint32_t> only,
                     std::vector<TelemetryMode>& modes) {
  bool complete = true;
  for (std::uint32_t mode = 0; mode < kTelemetryModes; ++mode) {
    if (only && *only != mode) continue;
    bool handled = false;
    const auto handler = [&, mode](const StorageList& list) {
      handled = true;
      modes.push_back({mode, {}});
      return readTelemetryList(
          list.bytes, list.characteristics, context.err,
          [&](const KvDictionary& record) { modes.back().buses.push_back(gathered(record)); });
    };
    const ListRequest request{kTelemetryList, handler, mode};
    const bool read = fetchLists({&request, 1}, false);
    complete = complete && read && handled;
  }
  return complete;
}

int runTelemetry(const ToolContext& context, std::optional<std::uint32_t> only) {
  std::vector<TelemetryMode> modes;
  const bool complete = gatherTelemetry(context, only, modes);
  Json document = Json::array();
  for (const auto& [mode, buses] : modes) {
    Json list = Json::array();
    for (std::size_t bus = 0; bus < buses.size(); ++bus) {
      if (context.json) {
        list.push_back(jsonOf(buses[bus].get()));
      } else {
        printHeading(context, fmt::format("Mode {}, bus {}", mode, bus));
        printRecord(context, *buses[bus]);
      }
    }
    document.push_back({{"mode", mode}, {"buses", std::move(list)}});
  }
  if (context.json) printJson(context, document);
  return complete ? kSuccess : complainOfList(context, "telemetry list");
}

int runValidity(const ToolContext& context) {
  KvRef<KvDictionary> lists;
  const ListRequest request{kValidityList, [&lists](const StorageList& list) {
                              lists = readValidityList(list.bytes);
                              return static_cast<bool>(lists);
                            }};
  fetchLists({&request, 1}, false);
  if (context.json) {
    printJson(context, jsonOf(lists.get()));
  } else if (lists) {
    Table table({{"list"}, {"records", Align::Right}, {"values", Align::Left, true}});
    for (const auto& [key, value] : *lists) {
      table.add({std::string(key->view()),
                 integerText(static_cast<std::int64_t>(kvCast<KvArray>(value.get())->size())),
                 valuesText(value.get())});
    }
    printHeading(context, "Validity lists");
    table.print(context);
  }
  return lists ? kSuccess : complainOfList(context, "validity list");
}

int runDefects(const ToolContext& context) {
  std::vector<KvRef<KvDictionary>> records;  // the summary first
  const ListRequest request{kDefectsList, [&records](const StorageList& list) {
                              return readDefectsList(list, [&records](const KvDictionary& record) {
                                records.push_back(record.copy());
                              });
                            }};
  const bool read = fetchLists({&request, 1}, false) && !records.empty();
  if (context.json) {
    Json defects = Json::array();
    for (std::size_t i = 1; i < records.size(); ++i) defects.push_back(jsonOf(records[i].get()));
    printJson(context, {{"summary", jsonOf(records.empty() ? nullptr : records[0].get())},
                        {"defects", std::move(defects)}});
  } else if (!records.empty()) {
    printHeading(context,
                 fmt::format("{} of the factory, {} found since",
                             kvText(records[0]->get("Factory Count")), records.size() - 1));
    std::vector<Column> columns;
    if (records.size() > 1) {
      for (const auto& [name, value] : *records[1]) {
        columns.push_back({std::string(name->view()), Align::Right});
      }
    }
    Table table(std::move(columns));
    for (std::size_t i = 1; i < records.size(); ++i) {
      std::vector<Cell> row;
      for (const auto& [name, value] : *records[i]) row.emplace_back(kvText(value.get()));
      table.add(std::move(row));
    }
    if (!table.empty()) table.print(context);
  }
  return read ? kSuccess : complainOfList(context, "defects list");
}

// The log that could be written now: made with the steps of the daily job, but whatever the write
// amplification and the time of the last log.
struct LogPreview {
  bool complete = false;  // every list could be handled
  bool wanted = false, due = true;
  double threshold = 0;
  std::optional<double> last;
  DryRun run;
};

LogPreview previewStorageLog(const Platform& platform, std::FILE* notices) {
  LogPreview preview;
  preview.threshold = writeAmplificationThreshold();
  preview.last = lastStorageLog();
  preview.due = !preview.last ||
                !(platform.clock->secondsSince1970() - *preview.last < kSecondsBetweenStorageLogs);
  Platform variant = preview.run.variantOf(platform);
  variant.preferences->set(knownPreference("SSLastLoggedAt"), nullptr);
  const PlatformScope scope(std::move(variant));
  const std::uint8_t force = std::exchange(gForceCollectionSet, std::uint8_t{1});
  preview.complete = dumpStorageLists(false, notices);
  gForceCollectionSet = force;
  preview.wanted = force != 0 || gCurrentUserWamp > preview.threshold;
  return preview;
}

std::string timeText(std::optional<double> seconds) {
  return seconds ? dateAndTimeText(*seconds) : "never";
}

int runStorageLog(const ToolContext& context) {
  const LogPreview preview = previewStorageLog(*context.platform, context.err);
  const auto& logs = preview.run.logs;
  const bool made = !logs.empty();
  if (context.json) {
    printJson(context, {{"wouldBeWritten", made && preview.wanted && preview.due},
                        {"userWriteAmplification", jsonOfReal(gCurrentUserWamp)},
                        {"intermediateWriteAmplification", jsonOfReal(gCurrentSysWamp)},
                        {"threshold", jsonOfReal(preview.threshold)},
                        {"lastWritten", preview.last ? Json(timeText(preview.last)) : Json()},
                        {"structuredRecords", preview.run.records},
                        {"text", made ? Json(logs[0].body) : Json()}});
  } else {
    printHeading(context, "Storage log, a preview: nothing is written");
    Table table({{""}, {""}});
    table.add({"User write amplification",
               fmt::format("{}, {} {}", realText(gCurrentUserWamp),
                           preview.wanted ? "a log is wanted above" : "a log is wanted only above",
                           realText(preview.threshold))});
    table.add({"Intermediate", realText(gCurrentSysWamp)});
    table.add({"Last written", timeText(preview.last)});
    if (!preview.due) {
      table.add({"Next one from", timeText(*preview.last + kSecondsBetweenStorageLogs)});
    }
    table.add({"Structured-data records", std::to_string(preview.run.records)});
    table.print(context);
    if (made) {
      printLine(context, "");
      eachLine(logs[0].body, [&](std::string_view line) { printLine(context, line); });
    }
  }
  if (!made) return complain(context, "no storage log can be made", kWrong);
  return preview.complete ? kSuccess : complain(context, "not every list could be read", kWrong);
}

}  // namespace

void addNandListCommands(CLI::App& nand, ToolContext& context) {
  const auto mode = std::make_shared<std::optional<std::uint32_t>>();
  addNandCommand(nand, context, "telemetry", "Show the read-algorithm counters of each flash bus",
                 [&context, mode] { return runTelemetry(context, *mode); })
      .option("--mode", {"MODE", ValueKind::Number}, mode.get(), "Only this mode, 0 to 2")
      .within(0, static_cast<int>(kTelemetryModes) - 1);
  addNandCommand(nand, context, "validity", "Show the validity lists",
                 [&context] { return runValidity(context); });
  addNandCommand(nand, context, "defects",
                 "Show defects of the flash: factory defects and later ones",
                 [&context] { return runDefects(context); });
  addNandCommand(nand, context, "storage-log", "Show the weekly storage log",
                 [&context] { return runStorageLog(context); })
      .flag("--preview", "Show it as it would be written now; write nothing")
      .required();
}

}  // namespace tally::tools
