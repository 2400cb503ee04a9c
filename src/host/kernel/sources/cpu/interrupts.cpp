#include "host/kernel/sources/cpu/interrupts.h"

#include <algorithm>
#include <array>

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

constexpr std::size_t kLargestInterrupts = 4u << 20;
constexpr std::size_t kMostProcessors = 4096, kMostFields = 1u << 20;

// Which processor each column is of: those that are online.
struct Columns {
  std::array<std::uint16_t, kMostProcessors> processors;
  std::size_t count = 0;

  explicit Columns(std::string_view header) {
    constexpr std::string_view kPrefix = "CPU";
    for (std::string_view word = takeWord(header);
         word.starts_with(kPrefix) && count < kMostProcessors; word = takeWord(header)) {
      const std::int64_t number = counterOf(word.substr(kPrefix.size()));
      const bool isKnown = number >= 0 && number < std::int64_t{kMostProcessors};
      processors[count++] = isKnown ? static_cast<std::uint16_t>(number) : UINT16_MAX;
    }
  }
};

struct Line {
  std::string_view label, what;
  std::size_t count = 0;  // of its numbers
};

std::string_view takeLabel(std::string_view& line) {
  std::string_view label = takeWord(line);
  if (!label.ends_with(':')) return {};
  label.remove_suffix(1);
  return label;
}

// Numbers name lines anew at each boot: then the device does, which stands at the end, after two
// blanks or more.
std::string nameOf(const Line& line) {
  const std::string_view what = trimmed(line.what);
  const std::size_t gap = what.rfind("  ");
  if (counterOf(line.label) == kNoReading || gap == std::string_view::npos) {
    return std::string(line.label);
  }
  return std::string(what.substr(gap + 2));
}

void findLinesOf(const SystemTree& tree, Findings& findings, const ChannelRow& row) {
  const std::string path(row.file);
  const auto content = tree.text(path, kLargestInterrupts);
  if (!content || content->empty()) return;
  std::string_view text(*content);
  const Columns columns(takeLine(text));
  std::size_t width = 0;
  for (std::size_t i = 0; i < columns.count; ++i) {
    if (columns.processors[i] < kMostProcessors)
      width = std::max<std::size_t>(width, columns.processors[i] + 1u);
  }
  if (width == 0) return;
  std::vector<Line> lines;
  eachLine(text, [&](std::string_view rest) {
    Line line{takeLabel(rest), rest, 0};
    while (line.count < columns.count && counterOf(takeWord(rest)) != kNoReading) {
      line.what = rest;
      ++line.count;
    }
    const bool isKnown =
        line.count > 0 && !line.label.empty() && lines.size() < kMostFields / width;
    if (isKnown) lines.push_back(line);
  });
  std::vector<std::string> names, places;
  FileLayout layout{{}, width};
  for (const Line& line : lines) {
    layout.labels.emplace_back(line.label);
    names.push_back(nameOf(line));
    const std::string_view what = trimmed(line.what);
    std::string place(trimmed(what.substr(0, what.rfind("  "))));
    places.push_back(std::move(place));
  }
  names = uniqueNames(names, places);
  const std::uint32_t file = findings.addFile(row.source, path, parseInterrupts, std::move(layout));
  for (std::size_t i = 0; i < lines.size(); ++i) {
    // Errors are counted for all processors together.
    const bool isTotal = lines[i].count == 1;
    const std::size_t first = i * width + (isTotal ? columns.processors[0] : 0u);
    findings.addArray(row, {}, file, static_cast<std::uint32_t>(first), isTotal ? 1 : width,
                      names[i]);
  }
}

}  // namespace

void parseInterrupts(std::string_view text, const FileLayout& layout,
                     std::span<std::int64_t> fields) {
  if (text.empty()) return;
  const Columns columns(takeLine(text));
  std::size_t hint = 0;
  eachLine(text, [&](std::string_view line) {
    const std::string_view label = takeLabel(line);
    const std::size_t place =
        label.empty() ? layout.labels.size() : labelIndex(layout, label, hint);
    if (place == layout.labels.size()) return;
    for (std::size_t column = 0; column < columns.count; ++column) {
      const std::int64_t count = counterOf(takeWord(line));
      if (count == kNoReading) return;
      if (columns.processors[column] < layout.columns) {
        fields[place * layout.columns + columns.processors[column]] = count;
      }
    }
  });
}

void findInterrupts(const SystemTree& tree, Findings& findings) {
  findLinesOf(tree, findings, rowsOf(KernelSource::Interrupts).front());
}

void findSoftInterrupts(const SystemTree& tree, Findings& findings) {
  findLinesOf(tree, findings, rowsOf(KernelSource::SoftInterrupts).front());
}

}  // namespace tally
