#include "tools/storage/nand_commands.h"

#include <algorithm>
#include <memory>
#include <nlohmann/json.hpp>

#include "storage/auxiliary/health.h"
#include "storage/auxiliary_metrics.h"
#include "storage/exporter.h"
#include "storage/nand_info.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"
#include "tools/storage/nand_devices.h"
#include "tools/storage/nand_event_commands.h"
#include "tools/storage/nand_groups.h"
#include "tools/storage/nand_list_commands.h"
#include "tools/storage/nand_snapshot_commands.h"
#include "tools/storage/wear_view.h"

namespace tally::tools {
namespace {

// The failure that the dictionary records; empty if there is none.
std::string failureOf(const KvDictionary& info) {
  return info.contains(kNANDInfoErrorKey) ? kvText(info.get(kNANDInfoErrorMessageKey)) : "";
}

int complainOf(const ToolContext& context, const std::string& failure) {
  return complain(context, "no storage figures: " + failure, kWrong);
}

// The values of a family: many of them as the buckets that are not empty.
std::string familyText(const NandFigure& figure) {
  constexpr std::size_t kShownWhole = 16;
  const auto& values = figure.values;
  std::string text;
  if (values.size() <= kShownWhole) {
    for (const std::int64_t value : values) text += (text.empty() ? "" : " ") + integerText(value);
    return text;
  }
  const auto [least, most] = std::minmax_element(values.begin(), values.end());
  return fmt::format("{} values, {} to {}, most at {}{}", values.size(), integerText(*least),
                     integerText(*most), figure.name, *figure.first + (most - values.begin()));
}

void printInfo(const ToolContext& context, const KvDictionary& info, const std::string& text) {
  for (const NandGroup& group : groupNandInfo(info, text)) {
    printHeading(context, group.title);
    Table table({{""}, {"", Align::Left, true}});
    for (const NandFigure& figure : group.figures) {
      if (figure.first) {
        const std::int64_t last = *figure.first + std::ssize(figure.values) - 1;
        table.add({fmt::format("{}{}-{}", figure.name, *figure.first, last), familyText(figure)});
      } else {
        table.add({figure.name, integerText(figure.values.front())});
      }
    }
    table.print(context);
  }
}

int runInfo(const ToolContext& context, const std::string& text) {
  const auto info = CopyNANDInfo();
  info->merge(*CopyVMFreezerNANDInfo());
  if (context.json) {
    auto chosen = KvDictionary::create();
    for (const auto& [key, value] : *info) {
      if (key->view().find(text) != std::string_view::npos) chosen->set(key, value);
    }
    printJson(context, jsonOf(chosen.get()));
  } else {
    printInfo(context, *info, text);
  }
  for (const auto key : {kNANDInfoReclaimErrorMessageKey, kNANDInfoVMFreezerErrorMessageKey}) {
    if (const auto message = info->getString(key)) complain(context, *message, kWrong);
  }
  if (const std::string failure = failureOf(*info); !failure.empty()) {
    return complainOf(context, failure);
  }
  const bool found = std::ranges::any_of(*info, [&](const auto& entry) {
    return entry.key->view().find(text) != std::string_view::npos;
  });
  return found ? kSuccess : complain(context, "no figure of that name: " + text, kWrong);
}

struct HealthFigure {
  const char* label;
  std::string_view key;  // in the summary
  const char* unit;
  std::int64_t doubtfulFrom, badFrom;  // the figure is shown in the ink of what it reached
};
constexpr HealthFigure kHealthFigures[] = {
    {"Wear, most used part", kNANDInfoHealthMaxPercentageNANDUsedKey, " %", 80, 100},
    {"  user partition", "vellum.NANDInfo.UserPartitionPEPercentUsed", " %", 80, 100},
    {"  intermediate partition", "vellum.NANDInfo.IntermediatePartitionPEPercentUsed", " %", 80,
     100},
    {"  firmware updates", "vellum.NANDInfo.fwUpdatesPercentUsed", " %", 80, 100},
    {"End-to-end errors, worst counter", kNANDInfoHealthMaxE2EErrorsKey, "", 1, 1},
    {"Host read errors", kNANDInfoHealthHostReadErrorsKey, "", 1, 1},
    {"Grown bad blocks", "vellum.NANDInfo.numGrownBad", "", INT64_MAX, INT64_MAX},
};
constexpr std::string_view kSpareKey = "vellum.NANDInfo.spareAvailablePercent";

// The summary has a 0 for what the driver does not export, which would look like good health.
bool isExported(const KvDictionary& info, std::string_view key) {
  const auto counters = countersOfHealthFigure(key);
  if (counters.empty()) return info.contains(key);
  return std::ranges::any_of(counters, [&](std::string_view one) { return info.contains(one); });
}

Cell figureCell(const KvDictionary& info, const KvDictionary& health, const HealthFigure& figure) {
  if (!isExported(info, figure.key)) return {"not exported", Ink::Faint};
  // The figures are counts of 32 bits, of which the upper half reads as negative.
  const std::int64_t value = static_cast<std::uint32_t>(health.getInt64(figure.key).value_or(0));
  const Ink ink = value >= figure.badFrom        ? Ink::Bad
                  : value >= figure.doubtfulFrom ? Ink::Doubtful
                                                 : Ink::Plain;
  return {integerText(value) + figure.unit, ink};
}

void printHealth(const ToolContext& context, const KvDictionary& info, const KvDictionary& health,
                 bool retirable, bool deletion) {
  printHeading(context, "Storage health");
  Table table({{""}, {"", Align::Right}});
  for (const HealthFigure& figure : kHealthFigures) {
    table.add({figure.label, figureCell(info, health, figure)});
  }
  const auto spare = health.getInt64(kSpareKey).value_or(0);
  table.add({"Spare blocks left", info.contains(kSpareKey) ? Cell{integerText(spare) + " %",
                                                                  retirable ? Ink::Bad : Ink::Good}
                                                           : Cell{"not exported", Ink::Faint}});
  table.print(context);
  printLine(context, "");
  if (retirable) {
    printLine(context, "The storage should be retired: its spare blocks are used up.", Ink::Bad);
  } else {
    printLine(context, "Nothing says that the storage should be retired.", Ink::Good);
  }
  if (deletion) {
    printLine(context, "The driver recommends to delete content.", Ink::Doubtful);
  }
}

int runHealth(const ToolContext& context, const std::optional<std::string>& device) {
  const auto info = CopyNANDInfo();
  const std::string failure = failureOf(*info);
  if (!failure.empty()) return complainOf(context, failure);
  const auto health = healthOfNandInfo(*info);
  const auto lab = internalLabExtract(*health);
  const bool retirable =
      info->contains(kSpareKey) && lab->getInt64(kNANDInfoHealthIsNANDRetirableKey) == kOne;
  const bool deletion = NandRecommendsContentDeletion()->value();
  const auto disk = findDisk(context, device);
  if (context.json) {
    Json document = {{"health", jsonOf(health.get())},
                     {"fixline", jsonOf(fixlineExtract(*health).get())},
                     {"internalLab", jsonOf(lab.get())},
                     {"ota", jsonOf(otaExtract(*health).get())},
                     {"recommendsContentDeletion", deletion}};
    if (disk) document["wear"] = wearJson(context, *disk);
    printJson(context, document);
  } else {
    printHealth(context, *info, *health, retirable, deletion);
    if (disk) printWear(context, *disk);
  }
  return retirable ? kWrong : kSuccess;
}

}  // namespace

void addNandCommands(CLI::App& app, ToolContext& context) {
  CLI::App& nand = addFamily(app, "nand", "Show figures and health of the flash storage");

  addNandDevices(nand, context);
  const auto text = std::make_shared<std::string>();
  const auto device = std::make_shared<std::optional<std::string>>();
  addNandDiskCommand(nand, context, "info", "Show what the storage driver exports, in groups",
                     device, [&context, text] { return runInfo(context, *text); })
      .optionalArgument(kTextValue, text.get(), "Only keys that contain it");
  addNandDiskCommand(
      nand, context, "health",
      "Show wear, errors and spare blocks; exit status 1 when the storage should be retired",
      device, [&context, device] { return runHealth(context, *device); });

  addNandListCommands(nand, context);
  addNandEventCommands(nand, context);
  addNandSnapshotCommands(nand, context);
}

}  // namespace tally::tools
