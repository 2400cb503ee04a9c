// Walks over a collection, in four modes.
//
// A walk visits the channels of a level in array order, then the drivers' level, then the groups'
// level. A callback's result with bit 0 set stops the whole walk and is its result; other
// results are combined by OR. A malformed collection gives HwIterFailed.
#pragma once

#include <functional>

#include "hwreport/channels.h"

namespace tally {

inline bool walkFailed(int result) noexcept { return (result & 1) != 0; }

int iterateChannels(KvDictionary* collection, const HwReportCallback& callback);

// A result of exactly HwIterDrop removes the channel.
int pruneChannels(KvDictionary* collection, const HwReportCallback& callback);

// Builds a collection of the same levels from mutable copies of the channels, each handed to the
// callback first. A copy whose result is 0 is kept. *output is set when the walk succeeded. Copies
// are made in the arena.
using TransformCallback = std::function<int(KvDictionary* channel, KvDictionary* copy)>;
int transformChannels(KvDictionary* collection, KvArena& arena, const TransformCallback& callback,
                      KvRef<KvDictionary>* output,
                      const std::function<void(const KvDictionary&)>& ahead = nullptr);

// The same over the later of two collections. The callback gets pairs; a channel without a
// counterpart is kept as it is.
using DeltaCallback =
    std::function<int(KvDictionary* earlier, KvDictionary* later, KvDictionary* result)>;
int deltaChannels(KvDictionary* later, KvDictionary* earlier, KvArena& arena,
                  const DeltaCallback& callback, KvRef<KvDictionary>* output);

}  // namespace tally
