#include "recorder/refused_names.h"

#include <algorithm>

#include "base/hash.h"
#include "recorder/key_rules.h"

namespace tally {

void RefusedNames::note(const Row& row) {
  const std::uint32_t hash = hashBytes(row.text);
  const std::size_t used = std::min(added_, kMost);
  std::size_t at = 0;
  while (at < used && !(hashes_[at] == hash && textOf(slots_[at]) == row.text)) ++at;
  if (at == used) {
    if (!isRecordableName(row.text)) return;
    at = added_++ % kMost;
    hashes_[at] = hash;
    slots_[at].length = row.text.copy(slots_[at].text.data(), kLongest);
    slots_[at].row.count = 0;
  }
  Row& kept = slots_[at].row;
  const std::uint64_t before = kept.day == row.day ? kept.count : 0;
  kept = row;
  kept.text = {};
  kept.count += before;
}

void RefusedNames::clear() {
  added_ = 0;
  for (Slot& slot : slots_) {
    slot.row = {};
    slot.text.fill('\0');
  }
}

std::vector<RefusedNames::Row> RefusedNames::all() const {
  std::vector<Row> rows;
  for (std::size_t i = 0; i < std::min(added_, kMost); ++i) {
    const Slot& slot = slots_[(added_ - 1 - i) % kMost];
    rows.push_back(slot.row);
    rows.back().text = textOf(slot);
  }
  return rows;
}

}  // namespace tally
