#include "tools/channel_filter.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <iterator>

#include "hwreport/descriptions.h"

namespace tally::tools {
namespace {

constexpr struct {
  std::uint8_t format;
  std::string_view name;
} kFormats[] = {{kHwReportFormatUnknown, "unknown"},
                {kHwReportFormatSimple, "simple"},
                {kHwReportFormatState, "state"},
                {kHwReportFormatHistogram, "histogram"},
                {kHwReportFormatSimpleArray, "array"}};

bool isText(const KvString* text, const std::string& wanted) {
  return wanted.empty() || (text != nullptr && text->view() == wanted);
}

// A driver is wanted by its name alone or with its id.
bool isDriver(const KvString* driver, const std::string& wanted) {
  if (isText(driver, wanted)) return true;
  return driver != nullptr && driver->view().starts_with(wanted + " <id ");
}

}  // namespace

std::string_view formatName(std::uint8_t format) {
  const auto row = std::find_if(std::begin(kFormats), std::end(kFormats),
                                [format](const auto& r) { return r.format == format; });
  return row != std::end(kFormats) ? row->name : "unknown";
}

void ChannelFilter::addOptions(CLI::App& command) {
  command.add_option("--driver", driver, "Only this driver's, by name or NAME <id ID>")
      ->type_name("NAME");
  command.add_option("--group", group, "Only this group")->type_name("NAME");
  command.add_option("--subgroup", subgroup, "Only this subgroup")->type_name("NAME");
  command
      .add_option("--category", categories, "Only channels that share a category bit, e.g. 0x100")
      ->type_name("MASK");
  command.add_option("--format", format, "Only this format")
      ->check(CLI::IsMember({"simple", "state", "histogram", "array"}));
  command.add_option("--unit", unit, "Only this unit, as the list shows it")->type_name("UNIT");
}

bool ChannelFilter::admits(KvDictionary* channel) const {
  return isDriver(HwReportChannelGetDriverName(channel), driver) &&
         isText(HwReportChannelGetGroup(channel), group) &&
         isText(HwReportChannelGetSubGroup(channel), subgroup) &&
         isText(HwReportChannelGetUnitLabel(channel), unit) &&
         (!format || *format == formatName(HwReportChannelGetFormat(channel))) &&
         (!categories || (HwReportChannelGetCategories(channel) & *categories) != 0);
}

}  // namespace tally::tools
