#include "hwreport/channels/type_word.h"

#include "hwreport/channels/keys.h"
#include "hwreport/rows/channel_frame.h"

namespace tally {

KvArray* legendOf(const KvDictionary* channel) {
  if (channel == nullptr) return nullptr;
  const auto row = FrameChannel::of(channel);
  return row.frame != nullptr ? row.legend() : channel->getAs<KvArray>(*keys().legendChannel);
}

}  // namespace tally
