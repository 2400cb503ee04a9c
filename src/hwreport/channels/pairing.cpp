#include "hwreport/channels/pairing.h"

#include <algorithm>

#include "hwreport/channel.h"

namespace tally {

std::optional<KvDictionary*> EarlierChannels::counterpartOf(const KvDictionary& later,
                                                            std::size_t index) {
  if (index >= channels_.size()) return nullptr;
  auto* const same = channels_.getAs<KvDictionary>(index);
  const auto type = typeWordOf(&later);
  const auto sameType = typeWordOf(same);
  if (!type || !sameType) return std::nullopt;
  if (HwReportChannelGetDriverID(same) != HwReportChannelGetDriverID(&later)) return nullptr;
  const Key key{HwReportChannelGetChannelID(&later), type->bits};
  if (key == Key{HwReportChannelGetChannelID(same), sameType->bits}) return same;
  return search(key, cursor_.value_or(index + 1));
}

std::optional<KvDictionary*> EarlierChannels::search(const Key& key, std::size_t from) {
  if (!indexed_) buildIndex();
  while (!unreadable_.empty() && unreadable_.back() < from) unreadable_.pop_back();
  std::size_t found = channels_.size();
  if (const std::uint32_t first = firstOf(key); first != HashIndex::kNone) {
    std::uint32_t& ahead = ahead_[first];
    while (ahead != HashIndex::kNone && ahead < from) ahead = next_[ahead];
    if (ahead != HashIndex::kNone) found = ahead;
  }
  if (!unreadable_.empty() && unreadable_.back() < found) return std::nullopt;
  if (found == channels_.size()) return nullptr;
  cursor_ = found + 1;
  return channels_.getAs<KvDictionary>(found);
}

void EarlierChannels::buildIndex() {
  indexed_ = true;
  const std::size_t count = channels_.size();
  keys_.resize(count);
  next_.assign(count, HashIndex::kNone);
  ahead_.resize(count);
  firsts_.reserve(count);
  std::vector<std::uint32_t> lasts(count);  // by first position
  for (std::uint32_t i = 0; i < count; ++i) {
    const auto* const channel = channels_.getAs<KvDictionary>(i);
    const auto type = typeWordOf(channel);
    if (!type) {
      unreadable_.push_back(i);
      continue;
    }
    keys_[i] = {HwReportChannelGetChannelID(channel), type->bits};
    const std::uint32_t first = firstOf(keys_[i]);
    if (first == HashIndex::kNone) {
      firsts_.add(hashOf(keys_[i]), i);
      ahead_[i] = lasts[i] = i;
    } else {
      next_[lasts[first]] = i;
      lasts[first] = i;
    }
  }
  std::ranges::reverse(unreadable_);
}

std::uint32_t EarlierChannels::firstOf(const Key& key) const {
  return firsts_.find(hashOf(key), [&](std::uint32_t position) { return keys_[position] == key; });
}

std::uint32_t EarlierChannels::hashOf(const Key& key) {
  const std::uint64_t words[] = {key.channelID, key.typeBits};
  return hashWords(words);
}

}  // namespace tally
