// Walks over a collection.
//
// A walk visits the channels of a level in array order, then the drivers' level, then the groups'
// level. A callback's result with bit 0 set stops the whole walk and is its result; other
// results are combined by OR. A malformed collection gives HwIterFailed.
#pragma once

#include <functional>

#include "hwreport/channels.h"
#include "hwreport/rows/channel_frame.h"

namespace tally {

inline bool walkFailed(int result) noexcept { return (result & 1) != 0; }

int iterateChannels(KvDictionary* collection, const HwReportCallback& callback);

// A result of exactly HwIterDrop removes the channel.
int pruneChannels(KvDictionary* collection, const HwReportCallback& callback);

// The channels of one level. Borrowed from the level.
class LevelChannels {
 public:
  // Without channels when the level has none; malformed when they are not in an array.
  explicit LevelChannels(const KvDictionary& level);
  bool malformed() const noexcept { return malformed_; }
  explicit operator bool() const noexcept { return frame_ || array_ != nullptr; }

  // Null when they are not rows of one frame.
  const ChannelFrame* frame() const noexcept { return frame_.get(); }
  // Copies of the channels up to the first item that is not one, as a frame; and the same for a
  // caller that will set the elements, so that they may be missing.
  KvRef<ChannelFrame> copy() const;
  KvRef<ChannelFrame> copyWithoutElements() const;
  // The latter with the rows of the frame, of which there may be more.
  KvRef<ChannelFrame> copyOfFrame() const;
  // True when there is no such item. REQUIRES: the frame is a copy, and has all its rows.
  bool isWhole(const ChannelFrame& frame) const;
  // REQUIRES: there are channels.
  const KvArray& array() const;

 private:
  const KvDictionary* level_;
  KvRef<const ChannelFrame> frame_;
  const KvArray* array_ = nullptr;
  bool malformed_ = false;
};

// Builds a collection of the same levels. Each level's channels are handed to the step, with those
// of the same level of another collection if there is one; it makes what replaces them. *output is
// set when the walk succeeded.
using LevelStep = std::function<int(const LevelChannels& channels, const LevelChannels* others,
                                    KvRef<ChannelFrame>* output)>;
int transformLevels(KvDictionary* collection, const KvDictionary* other, bool needsOther,
                    const LevelStep& step, KvRef<KvDictionary>* output);

}  // namespace tally
