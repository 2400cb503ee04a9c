#include "host/kernel/sources/system/pressure.h"

#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"

namespace tally {

void parsePressure(std::string_view text, const FileLayout& layout,
                   std::span<std::int64_t> fields) {
  std::size_t hint = 0;
  eachLine(text, [&](std::string_view line) {
    const std::size_t place = labelIndex(layout, takeWord(line), hint);
    constexpr std::string_view kTotal = "total=";
    for (std::string_view word = takeWord(line); !word.empty(); word = takeWord(line)) {
      if (place < fields.size() && word.starts_with(kTotal)) {
        fields[place] = counterOf(word.substr(kTotal.size()));
      }
    }
  });
}

void findPressure(const SystemTree& tree, Findings& findings) {
  auto rows = rowsOf(KernelSource::Pressure);
  while (!rows.empty()) {
    // The rows of a file: "io.some" and "io.full" of the lines "some" and "full".
    FileLayout layout;
    const std::string path(rows.front().file);
    for (const ChannelRow& row : rows) {
      if (row.file == path) layout.labels.emplace_back(row.name.substr(row.name.find('.') + 1));
    }
    const std::size_t count = layout.labels.size();
    if (tree.exists(path)) {
      const std::uint32_t file =
          findings.addFile(KernelSource::Pressure, path, parsePressure, std::move(layout));
      findings.addSimple(rows.first(count), {}, file);
    }
    rows = rows.subspan(count);
  }
}

}  // namespace tally
