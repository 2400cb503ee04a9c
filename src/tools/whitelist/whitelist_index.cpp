#include "tools/whitelist/whitelist_index.h"

#include <algorithm>
#include <numeric>
#include <tuple>
#include <utility>

namespace tally::tools {

class WhitelistIndex::Collector final : public WhitelistVisitor {
 public:
  Collector(Platform& platform, std::vector<KeyCandidate>& candidates)
      : platform_(platform), candidates_(candidates) {}

  bool beginGroup(std::string_view name) override {
    state_ = groupState(platform_, name);
    return true;
  }
  void entry(WhitelistSection section, const WhitelistEntry& entry) override {
    candidates_.push_back({section, entry, state_});
  }
  void malformed(const WhitelistPlace&) override {}

 private:
  Platform& platform_;
  std::vector<KeyCandidate>& candidates_;
  GroupState state_ = GroupState::InForce;
};

WhitelistIndex::WhitelistIndex(Platform& platform, const WhitelistContent& content) {
  Collector collector(platform, candidates_);
  visitWhitelist(content, collector);
  const auto place = [this](std::uint32_t i) {
    const KeyCandidate& candidate = candidates_[i];
    return std::tuple(isPrefixSection(candidate.section), candidate.entry.key);
  };
  order_.resize(candidates_.size());
  std::iota(order_.begin(), order_.end(), 0U);
  std::ranges::stable_sort(order_, {}, place);
  for (std::uint32_t first = 0, end = 0; first < order_.size(); first = end) {
    while (end < order_.size() && place(order_[end]) == place(order_[first])) ++end;
    const KeyCandidate& candidate = candidates_[order_[first]];
    (isPrefixSection(candidate.section) ? prefixes_ : exact_)
        .set({candidate.entry.key, first, end - first});
  }
  prefixes_.buildPrefixIndex();
}

std::vector<const KeyCandidate*> WhitelistIndex::find(std::string_view key) const {
  std::vector<const KeyCandidate*> found;
  const auto add = [&](const Run& run) {
    for (std::uint32_t i = 0; i < run.count; ++i) {
      found.push_back(&candidates_[order_[run.first + i]]);
    }
  };
  if (const Run* const run = exact_.exact(key)) add(*run);
  prefixes_.forEachPrefix(key, add);
  std::ranges::sort(found);  // by address, which is the order of the file
  return found;
}

}  // namespace tally::tools
