#include "hwreport/sampling/interest_list.h"

#include <bit>

#include "platform/protocol/hub_protocol.h"

namespace tally {

void InterestList::add(const ChannelFrame& channels) {
  static_assert(std::endian::native == std::endian::little);
  const auto index = channels.rows().index();
  complete_ = complete_ && index->complete();
  count_ += channels.size();
  words_[0] = static_cast<std::uint32_t>(count_);
  if (!complete()) return;
  words_.reserve(words_.size() + channels.size() * 3);
  for (std::size_t i = 0; i < channels.size(); ++i) {
    const std::size_t row = channels.rowOf(i);
    words_.insert(words_.end(),
                  {index->driverID(row), index->channelID(row), index->typeBits(row)});
  }
}

}  // namespace tally
