// KeyTable: whitelisted keys or key prefixes of one kind, with their options.
#pragma once

#include <cstdint>
#include <string_view>
#include <vector>

#include "base/hash.h"
#include "kv/value.h"

namespace tally {

struct WhitelistEntry {
  KvRef<KvString> key;  // the exact key, or the prefix
  KvRef<KvDictionary> options;
  KvRef<KvString> group;  // the group that it was taken from
};

class KeyTable {
 public:
  // Reserves capacity for this many further entries.
  void reserve(std::size_t further);
  // Adds an entry; it replaces one of the same key from an earlier group.
  void set(WhitelistEntry entry);
  // Must be called before longestPrefix(), and after the last set().
  void buildPrefixIndex();

  // Null when there is none.
  const WhitelistEntry* exact(std::string_view key) const;
  // The longest entry that is a prefix of the key; null when there is none. Takes logarithmic time,
  // and a step for each further entry nested inside it.
  const WhitelistEntry* longestPrefix(std::string_view key) const;
  const std::vector<WhitelistEntry>& entries() const { return entries_; }

 private:
  static constexpr std::uint32_t kNone = UINT32_MAX;
  struct SortedPrefix {
    std::uint32_t entry;   // into entries_
    std::uint32_t parent;  // the longest other prefix that this one begins with, into sorted_
  };
  std::uint32_t position(std::string_view key, std::uint32_t hash) const {
    return positions_.find(hash, [&](auto i) { return entries_[i].key->view() == key; });
  }
  std::vector<WhitelistEntry> entries_;
  HashIndex positions_;
  std::vector<SortedPrefix> sorted_;
};

}  // namespace tally
