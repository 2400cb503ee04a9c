#include "tools/storage/nand_devices.h"

#include <fmt/core.h>

#include <algorithm>
#include <nlohmann/json.hpp>

#include "tools/frame/table.h"
#include "tools/storage/nand_command.h"

namespace tally::tools {
namespace {

std::string ageText(std::int64_t seconds) {
  constexpr struct {
    std::int64_t seconds;
    std::string_view noun;
  } kUnits[] = {{86400, "day"}, {3600, "hour"}, {60, "minute"}};
  for (const auto& unit : kUnits) {
    if (seconds >= unit.seconds) {
      return counted(static_cast<std::uint64_t>(seconds / unit.seconds), unit.noun) + " ago";
    }
  }
  return "now";
}

// A card lies where an eMMC would, and says nothing of its wear.
std::string kindText(const FlashDisk& disk) {
  return disk.kind == DiskKind::Other && disk.isRemovable ? "removable"
                                                          : std::string(diskKindName(disk.kind));
}

Cell figureCell(const Figure<PercentRange>& figure) {
  return figure ? Cell(rangeText(figure->value)) : Cell("not known", Ink::Faint);
}

Cell usedCell(const Wear& wear) {
  Cell cell = figureCell(wear.mostUsed());
  if (!wear.mostUsed() && wear.maximumErases) {  // of raw NAND the rated life is not known
    return counted(wear.maximumErases->value, "erasure");
  }
  constexpr unsigned kDoubtful = 80, kBad = 100;
  if (const auto& used = wear.mostUsed()) {
    cell.ink = used->value.least >= kBad        ? Ink::Bad
               : used->value.least >= kDoubtful ? Ink::Doubtful
                                                : Ink::Plain;
  }
  return cell;
}

std::string warningsText(const Wear& wear) {
  std::string text;
  for (std::size_t bit = 0; wear.warnings && bit < std::size(kWearWarnings); ++bit) {
    if ((wear.warnings->value >> bit & 1) == 0) continue;
    text.append(text.empty() ? "" : ", ").append(kWearWarnings[bit]);
  }
  return text;
}

template <class T>
void addFigure(Json& object, const char* name, const Figure<T>& figure) {
  if (!figure) return;
  Json value;
  if constexpr (std::is_same_v<T, PercentRange>) {
    value = rangeJson(figure->value);
  } else {
    value = figure->value;
  }
  object[name] = {{"value", std::move(value)}, {"origin", figure->origin}};
}

Json diskJson(const FlashDisk& disk) {
  Json object = {{"device", disk.name},
                 {"kind", diskKindName(disk.kind)},
                 {"isStorage", disk.isStorage},
                 {"removable", disk.isRemovable},
                 {"wear", nullptr}};
  if (!disk.wear) return object;
  const Wear& wear = *disk.wear;
  Json& figures = object["wear"] = Json::object();
  addFigure(figures, "used", wear.used);
  addFigure(figures, "fastAreaUsed", wear.fastUsed);
  addFigure(figures, "spare", wear.spare);
  addFigure(figures, "maximumErases", wear.maximumErases);
  addFigure(figures, "meanErases", wear.meanErases);
  addFigure(figures, "hostBytesRead", wear.hostBytesRead);
  addFigure(figures, "hostBytesWritten", wear.hostBytesWritten);
  addFigure(figures, "flashBytesWritten", wear.flashBytesWritten);
  addFigure(figures, "unsafeShutdowns", wear.unsafeShutdowns);
  addFigure(figures, "powerOnHours", wear.powerOnHours);
  addFigure(figures, "mediaErrors", wear.mediaErrors);
  addFigure(figures, "mediaErrorsSinceBoot", wear.mediaErrorsOfBoot);
  addFigure(figures, "badBlocks", wear.badBlocks);
  addFigure(figures, "celsius", wear.temperature);
  addFigure(figures, "warnings", wear.warnings);
  if (wear.ageSeconds) figures["ageSeconds"] = *wear.ageSeconds;
  return object;
}

int runDevices(const ToolContext& context) {
  const auto disks = context.platform->flashDisks->disks();
  if (context.json) {
    Json list = Json::array();
    for (const FlashDisk& disk : disks) list.push_back(diskJson(disk));
    printJson(context, list);
  }
  if (disks.empty()) {
    return complain(
        context, "the kernel shows no disks, or this device describes its storage driver", kWrong);
  }
  if (context.json) return kSuccess;
  Table table({{"Device"}, {"Kind"}, {"Used"}, {"Spare"}, {"Figures of"}, {"", Align::Left, true}});
  for (const FlashDisk& disk : disks) {
    const Wear wear = disk.wear.value_or(Wear());
    const std::string warnings = warningsText(wear);
    Cell remark(warnings, Ink::Bad);
    if (disk.isStorage) {
      remark = Cell("the device's storage" + (warnings.empty() ? "" : ": " + warnings),
                    warnings.empty() ? Ink::Strong : Ink::Bad);
    }
    table.add({disk.name, kindText(disk), usedCell(wear), figureCell(wear.spare),
               disk.wear ? Cell(ageText(wear.ageSeconds.value_or(0))) : Cell(""), remark});
  }
  table.print(context);
  return kSuccess;
}

}  // namespace

std::string rangeText(const PercentRange& range) {
  if (!range.most) return fmt::format("{} % or more", range.least);
  if (*range.most == range.least) return fmt::format("{} %", range.least);
  return fmt::format("{}-{} %", range.least, *range.most);
}

Json rangeJson(const PercentRange& range) {
  Json object = {{"least", range.least}, {"most", nullptr}};
  if (range.most) object["most"] = *range.most;
  return object;
}

std::optional<FlashDisk> findDisk(const ToolContext& context,
                                  const std::optional<std::string>& name) {
  for (FlashDisk& disk : context.platform->flashDisks->disks()) {
    if (name ? disk.name == *name : disk.isStorage) return std::move(disk);
  }
  return std::nullopt;
}

void addNandDevices(CLI::App& nand, ToolContext& context) {
  addCommand(nand, context, "devices",
             "List the flash disks, how worn they are, and which is the device's storage",
             [&context] { return runDevices(context); })
      .canPlay();
}

Command addNandDiskCommand(CLI::App& nand, ToolContext& context, const char* name,
                           const char* description, const ChosenDisk& device,
                           std::function<int()> run) {
  const auto runOn = [&context, device, run = std::move(run)] {
    if (!*device) return hasStorageDriver(context) ? run() : complainOfNoDriver(context);
    auto registry = context.platform->flashDisks->registryOf(**device);
    if (!registry) {
      return complain(context, "no disk of that name that says how worn it is: " + **device,
                      kWrong);
    }
    context.platform->deviceRegistry = std::move(registry);
    return run();
  };
  const Command command = addCommand(nand, context, name, description, runOn);
  command.option("--device", {"NAME", ValueKind::Disk}, device.get(),
                 "Another disk than that of the device's storage");
  command.canPlay();
  return command;
}

}  // namespace tally::tools
