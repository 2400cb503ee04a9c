#include "hwreport/channels/raw_element.h"

#include "hwreport/channels/keys.h"
#include "hwreport/rows/channel_frame.h"

namespace tally {

ChannelReading readingOf(const KvDictionary* channel) {
  if (channel == nullptr) return {};
  const auto row = FrameChannel::of(channel);
  if (row.frame != nullptr) return row.frame->reading(row.row());
  return {typeWordOf(channel), runOfValue(channel->get(*keys().rawElements))};
}

}  // namespace tally
