#include "hwreport/channels/pairing.h"

#include <bit>

#include "base/hash.h"
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
  if (const std::uint32_t representative = slotOf(key); representative != 0) {
    std::uint32_t& ahead = ahead_[representative - 1];
    while (ahead != 0 && ahead - 1 < from) ahead = next_[ahead - 1];
    if (ahead != 0) found = ahead - 1;
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
  next_.resize(count);
  ahead_.resize(count);
  slots_.resize(std::bit_ceil(count * 2));
  for (std::size_t i = count; i-- > 0;) {
    const auto* const channel = channels_.getAs<KvDictionary>(i);
    const auto type = typeWordOf(channel);
    if (!type) {
      unreadable_.push_back(i);
      continue;
    }
    keys_[i] = {HwReportChannelGetChannelID(channel), type->bits};
    std::uint32_t& slot = slotOf(keys_[i]);
    next_[i] = slot;
    ahead_[i] = slot = static_cast<std::uint32_t>(i + 1);
  }
}

std::uint32_t& EarlierChannels::slotOf(const Key& key) {
  const std::uint64_t words[] = {key.channelID, key.typeBits};
  const std::size_t mask = slots_.size() - 1;
  std::size_t slot = hashWords(words) & mask;
  while (slots_[slot] != 0 && keys_[slots_[slot] - 1] != key) slot = (slot + 1) & mask;
  return slots_[slot];
}

}  // namespace tally
