// Finds every entry of a whitelist that names a key, in force or not.
#pragma once

#include <cstdint>
#include <vector>

#include "config/key_table.h"
#include "config/whitelist_file.h"

namespace tally::tools {

// An entry of the file that names a key, in force or not, decisive or not.
struct KeyCandidate {
  WhitelistSection section;
  WhitelistEntry entry;
  GroupState state;
};

class WhitelistIndex {
 public:
  // The content must outlive the index.
  WhitelistIndex(Platform& platform, const WhitelistContent& content);
  // Those that name the key, in the order of the file. Valid as long as the index. Takes
  // logarithmic time, and a step for each that is found.
  std::vector<const KeyCandidate*> find(std::string_view key) const;
  // In the order of the file.
  const std::vector<KeyCandidate>& all() const { return candidates_; }

 private:
  class Collector;
  // The candidates of one text.
  struct Run {
    std::string_view key;
    std::uint32_t first, count;  // of order_
  };
  std::vector<KeyCandidate> candidates_;
  std::vector<std::uint32_t> order_;  // of candidates_, by exactness and text
  friend std::string_view keyText(const Run& run) { return run.key; }
  KeyTable<Run> exact_, prefixes_;
};

}  // namespace tally::tools
