// keyMap is laid out from its families at compile time, beside the row of every name.
#include "storage/statistics/key_map.h"

#include <array>
#include <vector>

#include "storage/statistics.h"
#include "storage/statistics/counter_names.h"
#include "storage/statistics/decimal_names.h"
#include "storage/statistics/key_map_families.h"

namespace tally {
namespace {

constexpr std::string_view kKeyPrefix = "vellum.NANDInfo.";

constexpr int rowsOf(const KeyMapFamily& family) {
  return family.first < 0 ? 1 : family.last - family.first + 1;
}

constexpr std::string_view reportOf(const KeyMapFamily& family) {
  return family.report != nullptr ? family.report : family.name;
}

constexpr std::size_t rowCount() {
  std::size_t rows = 0;
  for (const KeyMapFamily& family : kKeyMapFamilies) {
    rows += static_cast<std::size_t>(rowsOf(family));
  }
  return rows;
}
static_assert(rowCount() == kKeyMapRows);

constexpr std::size_t numberLength(int number) {
  return number < 0 ? 0 : decimalDigits(static_cast<unsigned>(number));
}

constexpr std::size_t poolSize() {
  std::size_t size = 0;
  for (const KeyMapFamily& family : kKeyMapFamilies) {
    for (int i = 0; i < rowsOf(family); ++i) {
      size += std::string_view(family.name).size() + numberLength(family.first + i) + 1;
      size +=
          kKeyPrefix.size() + reportOf(family).size() + numberLength(family.reportFirst + i) + 1;
    }
  }
  return size;
}

struct Layout {
  std::array<char, poolSize()> pool{};
  std::array<std::size_t, kKeyMapRows> name{}, nameLength{}, key{}, keyLength{};
};

constexpr char* appendNumbered(char* to, std::string_view text, int number) {
  to = appendText(to, text);
  return number < 0 ? to : appendDecimal(to, static_cast<unsigned>(number));
}

constexpr Layout makeLayout() {
  Layout layout;
  char* const start = layout.pool.data();
  char* to = start;
  std::size_t row = 0;
  for (const KeyMapFamily& family : kKeyMapFamilies) {
    for (int i = 0; i < rowsOf(family); ++i, ++row) {
      const bool numbered = family.first >= 0;
      layout.name[row] = static_cast<std::size_t>(to - start);
      char* end = appendNumbered(to, family.name, numbered ? family.first + i : -1);
      layout.nameLength[row] = static_cast<std::size_t>(end - to);
      to = end + 1;
      layout.key[row] = static_cast<std::size_t>(to - start);
      end = appendNumbered(appendText(to, kKeyPrefix), reportOf(family),
                           numbered ? family.reportFirst + i : -1);
      layout.keyLength[row] = static_cast<std::size_t>(end - to);
      to = end + 1;
    }
  }
  return layout;
}

constexpr Layout kLayout = makeLayout();

constexpr std::array<SPXKeyMapRow, kKeyMapRows + 1> makeRows() {
  std::array<SPXKeyMapRow, kKeyMapRows + 1> rows{};
  for (std::size_t row = 0; row < kKeyMapRows; ++row) {
    rows[row].name = {&kLayout.pool[kLayout.name[row]], kLayout.nameLength[row]};
    rows[row].key = {&kLayout.pool[kLayout.key[row]], kLayout.keyLength[row]};
  }
  return rows;
}

}  // namespace

constexpr std::array<SPXKeyMapRow, kKeyMapRows + 1> keyMap = makeRows();

namespace {

using RowsOfNames = std::array<std::uint16_t, kCounterNames>;

constexpr RowsOfNames makeRowsOfNames() {
  constexpr NameIndex<2048> index(keyMap, kKeyMapRows);
  RowsOfNames rows{};
  for (std::size_t name = 0; name < rows.size(); ++name) {
    rows[name] = index.find(keyMap, kNames.name(name));
  }
  return rows;
}

constexpr RowsOfNames kRowsOfNames = makeRowsOfNames();

}  // namespace

std::uint16_t keyMapRowOfName(std::uint16_t number) noexcept {
  return number < kRowsOfNames.size() ? kRowsOfNames[number] : kNoRow;
}

const KvRef<KvString>& keyMapKey(std::size_t row) {
  static const std::vector<KvRef<KvString>> keys = [] {
    std::vector<KvRef<KvString>> made;
    made.reserve(kKeyMapRows);
    for (std::size_t i = 0; i < kKeyMapRows; ++i) made.push_back(KvString::create(keyMap[i].key));
    return made;
  }();
  return keys[row];
}

}  // namespace tally
