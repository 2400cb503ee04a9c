#include "report/logged_distributions.h"

#include <algorithm>
#include <utility>

namespace tally {
namespace {

// Tags, indentation and the five numbers; a bucket with two numbers in its label; and the longest
// reference in place of a character.
constexpr std::size_t kMostAround = 400, kMostOfBucket = 160, kMostOfByte = 5;

}  // namespace

void LoggedDistributions::set(std::string_view key, DistributionResult result) {
  const std::size_t buckets = result.histogram ? result.histogram->size() : 0;
  mostBytes_ += kMostAround + 2 * kMostOfByte * key.size() + buckets * kMostOfBucket;
  const bool rises = byKey_.empty() && (entries_.empty() || entries_.back().key < key);
  if (!rises) {
    if (byKey_.empty()) {
      for (Entry& entry : entries_) byKey_.emplace(entry.key, &entry);
    }
    if (const auto known = byKey_.find(key); known != byKey_.end()) {
      known->second->result = std::move(result);
      return;
    }
  }
  Entry& entry = entries_.emplace_back(Entry{std::string(key), std::move(result)});
  if (!rises) byKey_.emplace(entry.key, &entry);
}

bool LoggedDistributions::hasHistograms() const {
  return std::ranges::any_of(
      entries_, [](const Entry& entry) { return static_cast<bool>(entry.result.histogram); });
}

}  // namespace tally
