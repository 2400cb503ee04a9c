#include "host/kernel/sources/storage/zram.h"

#include <algorithm>

#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"

namespace tally {

void findZram(const SystemTree& tree, Findings& findings) {
  for (const std::string& name : tree.list("/sys/block")) {
    const std::string directory = "/sys/block/" + name;
    // One that is not set up has no size.
    if (!name.starts_with("zram") || tree.number(directory + "/disksize").value_or(1) == 0)
      continue;
    const FoundDevice device{name, tree.text(directory + "/diskseq").value_or("")};
    auto rows = rowsOf(KernelSource::Zram);
    while (!rows.empty()) {
      const auto isSameFile = [&](const ChannelRow& row) { return row.file == rows.front().file; };
      const auto count = static_cast<std::size_t>(std::ranges::count_if(rows, isSameFile));
      const std::string path = directory + "/" + std::string(fileName(rows.front().file));
      if (tree.exists(path)) {
        const std::size_t known = numberCount(tree.text(path), count);
        const auto file = findings.addFile(KernelSource::Zram, path, parseNumbers, {{""}, known});
        findings.addSimple(rows.first(known), device, file);
      }
      rows = rows.subspan(count);
    }
  }
}

}  // namespace tally
