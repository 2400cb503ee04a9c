#include "host/kernel/sources/cpu/processor_time.h"

#include <algorithm>

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

constexpr std::size_t kLargestStat = 4u << 20;
constexpr std::size_t kStatColumns = 11;  // of the line "softirq"; times have 10
constexpr std::size_t kTimes = 10;

// The rows that are not times, by their lines. Of one line an array leaves out the first number,
// which is the total.
struct EventLine {
  std::string_view label;
  bool isArray = false;
};
constexpr EventLine kEventLines[] = {
    {"ctxt"},          {"processes"},     {"intr"},          {"softirq"},
    {"softirq", true}, {"procs_running"}, {"procs_blocked"},
};
static_assert(rowsOf(KernelSource::ProcessorTime).size() == kTimes + std::size(kEventLines));

bool isTime(std::string_view label) { return label.starts_with("cpu"); }

}  // namespace

void parseProcessorTime(std::string_view text, const FileLayout& layout,
                        std::span<std::int64_t> fields) {
  parseNamedNumbers(text, layout, fields);
  for (std::size_t line = 0; line < layout.labels.size(); ++line) {
    if (!isTime(layout.labels[line])) continue;
    for (std::int64_t& field : fields.subspan(line * layout.columns, layout.columns)) {
      field = scaled(field, kMillisecondsPerTick);
    }
  }
}

void findProcessorTime(const SystemTree& tree, Findings& findings) {
  const auto rows = rowsOf(KernelSource::ProcessorTime);
  const std::string path(rows.front().file);
  FileLayout layout{{}, kStatColumns};
  std::vector<std::size_t> counts;
  eachLine(tree.text(path, kLargestStat).value_or(""), [&](std::string_view line) {
    const std::string_view label = takeWord(line);
    const bool isKnown =
        isTime(label) ||
        std::ranges::find(kEventLines, label, &EventLine::label) != std::end(kEventLines);
    if (!isKnown || std::ranges::find(layout.labels, label) != layout.labels.end()) return;
    layout.labels.emplace_back(label);
    counts.push_back(numberCount(std::string(line.substr(0, 1024)), kStatColumns));
  });
  if (layout.labels.empty()) return;
  const FileLayout lines = layout;
  const auto file =
      findings.addFile(KernelSource::ProcessorTime, path, parseProcessorTime, std::move(layout));
  for (std::size_t i = 0; i < lines.labels.size(); ++i) {
    const std::string& label = lines.labels[i];
    const auto first = static_cast<std::uint32_t>(i * kStatColumns);
    const std::size_t count = std::min(counts[i], kTimes);
    if (label == "cpu") {
      findings.addSimple(rows.first(count), {}, file, first);
    } else if (isTime(label)) {
      findings.addArray(rowsOf(KernelSource::ProcessorTimes).front(), {channelWord(label)}, file,
                        first, count);
    }
    for (std::size_t event = 0; event < std::size(kEventLines); ++event) {
      if (kEventLines[event].label != label) continue;
      const ChannelRow& row = rows[kTimes + event];
      if (kEventLines[event].isArray) {
        findings.addArray(row, {}, file, first + 1, counts[i] - 1);
      } else {
        findings.addSimple({&row, 1}, {}, file, first);
      }
    }
  }
}

}  // namespace tally
