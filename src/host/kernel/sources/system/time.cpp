#include "host/kernel/sources/system/time.h"

#include <algorithm>

#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"

namespace tally {

void parseUptime(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  std::string_view line = trimmed(text);
  const std::string_view word = takeWord(line);
  const std::size_t point = std::min(word.find('.'), word.size());
  const std::string_view part = word.substr(std::min(point + 1, word.size()));
  const std::int64_t seconds = counterOf(word.substr(0, point));
  const std::int64_t hundredths = part.size() == 2 ? counterOf(part) : 0;
  if (hundredths == kNoReading) return;
  std::int64_t sum = scaled(seconds, 1000);
  if (sum != kNoReading && !__builtin_add_overflow(sum, 10 * hundredths, &sum)) fields[0] = sum;
}

void findTime(const SystemTree& tree, Findings& findings) {
  constexpr auto kRows = rowsOf(KernelSource::Time);
  const std::string path(kRows[0].file);
  if (!tree.exists(path)) return;
  findings.addSimple(kRows.first(1), {},
                     findings.addFile(KernelSource::Time, path, parseUptime, {{""}, 1}));
  findings.addSimple(
      kRows.subspan(1, 1), {},
      findings.addFile(KernelSource::Time, std::string(kClockPath), parseCounter, {{""}, 1}));
}

}  // namespace tally
