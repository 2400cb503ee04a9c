// The distributions of one daily log.
#pragma once

#include <cstddef>
#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>

#include "report/distribution_summary.h"

namespace tally {

// A new key comes last, a known one keeps its place.
class LoggedDistributions {
 public:
  struct Entry {
    std::string key;
    DistributionResult result;
  };

  // The key is valid UTF-8.
  void set(std::string_view key, DistributionResult result);
  bool empty() const { return entries_.empty(); }
  bool hasHistograms() const;
  // An upper bound of the size of these distributions in a document.
  std::size_t mostBytes() const { return mostBytes_; }

  auto begin() const { return entries_.begin(); }
  auto end() const { return entries_.end(); }

 private:
  std::deque<Entry> entries_;
  // Of the entries, once a key did not rise: until then no search is needed.
  std::unordered_map<std::string_view, Entry*> byKey_;
  std::size_t mostBytes_ = 0;
};

}  // namespace tally
