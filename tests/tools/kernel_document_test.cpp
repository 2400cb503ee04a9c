// The table of docs/linux.md, as the kernel's channels make it.
#include <fmt/format.h>

#include "document_table.h"
#include "host/kernel/channel_table.h"
#include "host/kernel/source_table.h"
#include "hwreport/hwreport.h"

namespace tally {
namespace {

std::string unitLabel(std::uint64_t unit) {
  const auto collection = HwReportCreateAggregate(0);
  HwReportAddChannelDescription(collection.get(), 1, KvString::create("d").get(), 1, 1, nullptr,
                                nullptr, nullptr, HwReportCreateUnitInfo(unit).get(), nullptr);
  std::string label;
  HwReportIterate(collection.get(), [&](KvDictionary* channel) {
    label = HwReportChannelGetUnitLabel(channel)->view();
    return HwIterContinue;
  });
  return label;
}

std::string channelText(const ChannelRow& row) {
  const SourceRow& source = sourceRow(row.source);
  std::string text(source.name);
  for (const std::string_view part : {source.device, row.name}) {
    if (!part.empty()) text.append(".").append(part);
  }
  return text;
}

std::string kindText(const ChannelRow& row) {
  const std::string semantics(textOf(row.semantics));
  return row.format == ChannelFormat::Array ? semantics + "s" : semantics;
}

TEST(KernelDocument, Channels) {
  std::string table =
      "| channel | unit | kind | since | bits | file | daily key | meaning |\n"
      "|---|---|---|---|---|---|---|---|\n";
  for (const ChannelRow& row : kChannelTable) {
    const bool isGauge = row.semantics == Semantics::Gauge;
    table += fmt::format("| `{}` | {} | {} | {} | {} | `{}` | {} | {} |\n", channelText(row),
                         unitLabel(row.unit), kindText(row), isGauge ? "" : textOf(row.scope),
                         row.width == 0 ? std::string() : std::to_string(row.width), row.file,
                         row.daily.empty() ? std::string() : fmt::format("`{}`", row.daily),
                         row.description);
  }
  expectInDocument("linux.md", table);
}

}  // namespace
}  // namespace tally
