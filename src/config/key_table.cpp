#include "config/key_table.h"

#include <algorithm>
#include <utility>

namespace tally {

void KeyTable::reserve(std::size_t further) {
  // Called for every section: at least doubles, so that a file of many small groups does not copy
  // all entries each time.
  const std::size_t wanted = entries_.size() + further;
  if (wanted > entries_.capacity()) entries_.reserve(std::max(wanted, entries_.capacity() * 2));
  positions_.reserve(wanted);
}

void KeyTable::set(WhitelistEntry entry) {
  const std::string_view key = entry.key->view();
  const std::uint32_t hash = hashBytes(key);
  if (const auto present = position(key, hash); present != HashIndex::kNone) {
    entries_[present] = std::move(entry);
    return;
  }
  positions_.add(hash, static_cast<std::uint32_t>(entries_.size()));
  entries_.push_back(std::move(entry));
}

void KeyTable::buildPrefixIndex() {
  sorted_.clear();
  for (std::uint32_t i = 0; i < entries_.size(); ++i) sorted_.push_back({i, kNone});
  const auto prefix = [this](const SortedPrefix& item) { return entries_[item.entry].key->view(); };
  std::sort(sorted_.begin(), sorted_.end(),
            [&](const auto& a, const auto& b) { return prefix(a) < prefix(b); });
  for (std::uint32_t i = 1; i < sorted_.size(); ++i) {
    std::uint32_t candidate = i - 1;
    while (candidate != kNone && !prefix(sorted_[i]).starts_with(prefix(sorted_[candidate]))) {
      candidate = sorted_[candidate].parent;
    }
    sorted_[i].parent = candidate;
  }
}

const WhitelistEntry* KeyTable::exact(std::string_view key) const {
  if (entries_.empty()) return nullptr;
  const auto found = position(key, hashBytes(key));
  return found != HashIndex::kNone ? &entries_[found] : nullptr;
}

const WhitelistEntry* KeyTable::longestPrefix(std::string_view key) const {
  // Every entry that sorts between a prefix of the key and the key itself begins with that prefix,
  // so the last entry not after the key is the longest match, or one of its parents is.
  const auto after = std::upper_bound(sorted_.begin(), sorted_.end(), key,
                                      [this](std::string_view wanted, const auto& item) {
                                        return wanted < entries_[item.entry].key->view();
                                      });
  auto position =
      after == sorted_.begin() ? kNone : static_cast<std::uint32_t>(after - sorted_.begin() - 1);
  while (position != kNone) {
    const WhitelistEntry& entry = entries_[sorted_[position].entry];
    if (key.starts_with(entry.key->view())) return &entry;
    position = sorted_[position].parent;
  }
  return nullptr;
}

}  // namespace tally
