// keyMap is laid out at compile time from the counter table, which has the group of each row too.
#include "storage/statistics/key_map.h"

#include <array>
#include <vector>

#include "storage/statistics.h"
#include "storage/statistics/counter_names.h"

namespace tally {
namespace {

constexpr std::string_view kKeyPrefix = "vellum.NANDInfo.";

constexpr std::size_t countRows() {
  std::size_t rows = 0;
  for (const StorageCounter& counter : kStorageCounters) rows += counter.reportCount();
  return rows;
}
constexpr std::size_t kRows = countRows();
static_assert(kRows < kNoRow);

constexpr std::size_t keyLength(const StorageCounter& counter, unsigned index) {
  const unsigned number = counter.firstReportNumber() + index;
  return kKeyPrefix.size() + counter.reportText().size() +
         (counter.hasReportNumber() ? decimalDigits(number) : 0);
}

constexpr std::size_t countKeyBytes() {
  std::size_t bytes = 0;
  for (const StorageCounter& counter : kStorageCounters) {
    for (unsigned i = 0; i < counter.reportCount(); ++i) bytes += keyLength(counter, i) + 1;
  }
  return bytes;
}

struct Layout {
  std::array<char, countKeyBytes()> keys{};  // each ends in a zero byte
  std::array<std::uint16_t, kRows + 1> keyStart{};
  std::array<std::uint16_t, kRows> name{};
  std::array<FigureGroup, kRows> group{};
  std::array<std::uint16_t, kCounterNames> rowOfName{};
};
static_assert(countKeyBytes() <= 0xFFFF);

constexpr Layout makeLayout() {
  Layout layout;
  layout.rowOfName.fill(kNoRow);
  char* const start = layout.keys.data();
  char* to = start;
  std::size_t row = 0;
  for (const StorageCounter& counter : kStorageCounters) {
    for (unsigned i = 0; i < counter.reportCount(); ++i, ++row) {
      layout.keyStart[row] = static_cast<std::uint16_t>(to - start);
      to = appendText(appendText(to, kKeyPrefix), counter.reportText());
      if (counter.hasReportNumber()) to = appendDecimal(to, counter.firstReportNumber() + i);
      ++to;
      layout.name[row] = kNames.numberOf(counter, counter.firstElement() + i);
      layout.group[row] = counter.group;
      std::uint16_t& rowOfName = layout.rowOfName[layout.name[row]];
      if (rowOfName == kNoRow) rowOfName = static_cast<std::uint16_t>(row);
    }
  }
  layout.keyStart[row] = static_cast<std::uint16_t>(to - start);
  return layout;
}

constexpr Layout kLayout = makeLayout();

// With the end row.
constexpr auto kRowsAndEnd = [] {
  std::array<SPXKeyMapRow, kRows + 1> rows{};
  for (std::size_t row = 0; row < kRows; ++row) {
    const std::size_t start = kLayout.keyStart[row];
    rows[row].name = kNames.name(kLayout.name[row]);
    rows[row].key = {&kLayout.keys[start], kLayout.keyStart[row + 1] - start - 1u};
  }
  return rows;
}();

}  // namespace

constinit const std::span<const SPXKeyMapRow> keyMap = std::span(kRowsAndEnd).first(kRows);

std::uint16_t keyMapRowOfName(std::uint16_t number) noexcept {
  return number < kLayout.rowOfName.size() ? kLayout.rowOfName[number] : kNoRow;
}

const KvRef<KvString>& keyMapKey(std::size_t row) {
  static const std::vector<KvRef<KvString>> keys = [] {
    std::vector<KvRef<KvString>> made;
    made.reserve(kRows);
    for (const SPXKeyMapRow& known : keyMap) made.push_back(KvString::create(known.key));
    return made;
  }();
  return keys[row];
}

FigureGroup keyMapGroup(std::size_t row) noexcept { return kLayout.group[row]; }

}  // namespace tally
