#include "host/kernel/sources/memory/memory.h"

#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

// The lines of the files, in the order of the table's rows.
constexpr std::string_view kMemoryLines[] = {"MemTotal",  "MemAvailable", "MemFree",
                                             "Cached",    "AnonPages",    "Shmem",
                                             "SwapTotal", "SwapFree",     "Slab"};
constexpr std::string_view kPagingLines[] = {"pgpgin",  "pgpgout",    "pswpin",  "pswpout",
                                             "pgfault", "pgmajfault", "oom_kill"};
static_assert(std::size(kMemoryLines) == rowsOf(KernelSource::Memory).size());
static_assert(std::size(kPagingLines) == rowsOf(KernelSource::Paging).size());

void findLines(const SystemTree& tree, Findings& findings, KernelSource source,
               std::span<const std::string_view> lines) {
  constexpr std::size_t kLargestText = 1u << 16;
  const std::span<const ChannelRow> rows = rowsOf(source);
  const std::string path(rows.front().file);
  const std::string text = tree.text(path, kLargestText).value_or("");
  FileLayout layout{{lines.begin(), lines.end()}, 1};
  std::vector<std::int64_t> fields(layout.fields(), kNoReading);
  parseNamedNumbers(text, layout, fields);
  const std::uint32_t file = findings.addFile(source, path, parseNamedNumbers, std::move(layout));
  // Counters that this kernel lacks have no channel.
  for (std::uint32_t i = 0; i < rows.size(); ++i) {
    if (fields[i] != kNoReading) findings.addSimple(rows.subspan(i, 1), {}, file, i);
  }
}

}  // namespace

void findMemory(const SystemTree& tree, Findings& findings) {
  findLines(tree, findings, KernelSource::Memory, kMemoryLines);
}

void findPaging(const SystemTree& tree, Findings& findings) {
  findLines(tree, findings, KernelSource::Paging, kPagingLines);
}

}  // namespace tally
