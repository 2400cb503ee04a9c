// KeyTable: entries by whole key or by longest prefix.
#pragma once

#include <algorithm>
#include <cstdint>
#include <string_view>
#include <utility>
#include <vector>

#include "base/hash.h"

namespace tally {

// keyText(entry) is the whole key, or the prefix.
template <class Entry>
class KeyTable {
 public:
  // Reserves capacity for this many further entries.
  void reserve(std::size_t further) {
    // Called for every section: at least doubles, so that a file of many small groups does not copy
    // all entries each time.
    const std::size_t wanted = entries_.size() + further;
    if (wanted > entries_.capacity()) entries_.reserve(std::max(wanted, entries_.capacity() * 2));
    positions_.reserve(wanted);
  }
  // Adds an entry; it replaces one of the same key that was added earlier.
  void set(Entry entry) {
    const std::uint32_t hash = hashBytes(keyText(entry));
    set(std::move(entry), hash);
  }
  // The same in two steps. Of many entries the first steps of some come first, and bring what the
  // second ones look at into the cache. REQUIRES: the table has capacity.
  std::uint32_t prepare(std::string_view key) const {
    const std::uint32_t hash = hashBytes(key);
    positions_.prefetch(hash);
    return hash;
  }
  void set(Entry entry, std::uint32_t hash) {
    const std::string_view key = keyText(entry);
    if (const auto present = position(key, hash); present != HashIndex::kNone) {
      entries_[present] = std::move(entry);
      return;
    }
    positions_.add(hash, static_cast<std::uint32_t>(entries_.size()));
    entries_.push_back(std::move(entry));
  }
  // Must be called before longestPrefix(), and after the last set().
  void buildPrefixIndex() {
    sorted_.clear();
    for (std::uint32_t i = 0; i < entries_.size(); ++i) sorted_.push_back({i, kNone});
    std::sort(sorted_.begin(), sorted_.end(),
              [this](const auto& a, const auto& b) { return prefixOf(a) < prefixOf(b); });
    for (std::uint32_t i = 1; i < sorted_.size(); ++i) {
      std::uint32_t candidate = i - 1;
      while (candidate != kNone &&
             !prefixOf(sorted_[i]).starts_with(prefixOf(sorted_[candidate]))) {
        candidate = sorted_[candidate].parent;
      }
      sorted_[i].parent = candidate;
    }
  }

  // Null when there is none.
  const Entry* exact(std::string_view key) const {
    if (entries_.empty()) return nullptr;
    const auto found = position(key, hashBytes(key));
    return found != HashIndex::kNone ? &entries_[found] : nullptr;
  }
  // The longest entry that is a prefix of the key; null when there is none. Takes logarithmic time,
  // and a step for each further entry nested inside it.
  const Entry* longestPrefix(std::string_view key) const {
    const std::uint32_t found = longest(key);
    return found != kNone ? &entries_[sorted_[found].entry] : nullptr;
  }
  // Calls visit(entry) for every entry that is a prefix of the key, the longest first.
  template <class Visit>
  void forEachPrefix(std::string_view key, const Visit& visit) const {
    // What begins the longest of them begins the key, and each other one begins it.
    for (std::uint32_t i = longest(key); i != kNone; i = sorted_[i].parent) {
      visit(entries_[sorted_[i].entry]);
    }
  }
  const std::vector<Entry>& entries() const { return entries_; }

 private:
  static constexpr std::uint32_t kNone = UINT32_MAX;
  struct SortedPrefix {
    std::uint32_t entry;   // into entries_
    std::uint32_t parent;  // the longest other prefix that this one begins with, into sorted_
  };
  std::uint32_t position(std::string_view key, std::uint32_t hash) const {
    return positions_.find(hash, [&](auto i) { return keyText(entries_[i]) == key; });
  }
  // The longest prefix of the key, into sorted_; kNone when there is none.
  std::uint32_t longest(std::string_view key) const {
    // Every entry that sorts between a prefix of the key and the key itself begins with that
    // prefix, so the last entry not after the key is the longest match, or one of its parents is.
    const auto after = std::upper_bound(
        sorted_.begin(), sorted_.end(), key,
        [this](std::string_view wanted, const auto& item) { return wanted < prefixOf(item); });
    auto position =
        after == sorted_.begin() ? kNone : static_cast<std::uint32_t>(after - sorted_.begin() - 1);
    while (position != kNone && !key.starts_with(prefixOf(sorted_[position]))) {
      position = sorted_[position].parent;
    }
    return position;
  }
  std::string_view prefixOf(const SortedPrefix& item) const {
    return keyText(entries_[item.entry]);
  }
  std::vector<Entry> entries_;
  HashIndex positions_;
  std::vector<SortedPrefix> sorted_;
};

}  // namespace tally
