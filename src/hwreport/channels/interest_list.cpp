#include "hwreport/channels/interest_list.h"

#include <bit>

#include "hwreport/channel.h"
#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/type_word.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

std::int32_t InterestList::fill(KvDictionary* desired) {
  static_assert(std::endian::native == std::endian::little);
  std::int32_t count = 0;
  words_.assign(1, 0);
  const int result = iterateChannels(desired, [&](KvDictionary* channel) {
    ++count;
    const std::uint64_t driverID = HwReportChannelGetDriverID(channel);
    const std::uint64_t channelID = HwReportChannelGetChannelID(channel);
    const auto type = typeWordOf(channel);
    if (driverID == kHwReportInvalidValue || channelID == kHwReportInvalidValue || !type) {
      complete_ = false;
    } else if (complete_) {
      words_.insert(words_.end(), {driverID, channelID, type->bits});
    }
    return HwIterContinue;
  });
  if (walkFailed(result)) return -1;
  complete_ = complete_ && static_cast<std::size_t>(count) <= kMostInterests;
  words_[0] = static_cast<std::uint32_t>(count);
  return count;
}

}  // namespace tally
