// Asks a channel all that can be asked of one.
#pragma once

#include "fuzz.h"
#include "hwreport/hwreport.h"

namespace tally::fuzz {

inline void askStates(KvDictionary* channel, std::int32_t index) {
  HwReportStateGetInTransitions(channel, index);
  HwReportStateGetResidency(channel, index);
  HwReportStateGetDutyCycle(channel, index);
  HwReportStateGetNameForIndex(channel, index);
  const auto found =
      HwReportStateGetIndexForID(channel, HwReportStateGetIDForIndex(channel, index));
  require(found < HwReportStateGetCount(channel) || found == -1, "a state's index is inside");
}

// Who made the channel: the library's own invariants hold only for its own channels.
enum class Maker { Library, Anybody };

inline void askBuckets(KvDictionary* channel, std::int32_t index, Maker maker) {
  HwReportHistogramGetBucketHits(channel, index);
  HwReportHistogramGetBucketMinValue(channel, index);
  HwReportHistogramGetBucketMaxValue(channel, index);
  HwReportHistogramGetBucketSum(channel, index);
  std::int64_t lower = 0, upper = 0;
  if (HwReportHistogramGetBucketBounds(channel, index, &lower, &upper) != 0) return;
  require(maker == Maker::Anybody ||
              static_cast<std::uint64_t>(lower) < static_cast<std::uint64_t>(upper),
          "bounds rise");
}

inline void askChannel(KvDictionary* channel, Maker maker = Maker::Library) {
  constexpr std::int32_t kFarOutside = 1 << 20;
  HwReportChannelGetCategories(channel);
  HwReportChannelGetChannelName(channel);
  HwReportChannelGetUnitLabel(channel);
  HwReportScaleValue(3, HwReportChannelGetUnit(channel), 0x0100000000000000);
  HwReportSimpleGetIntegerValue(channel);
  HwReportStateGetCurrent(channel);
  HwReportHistogramGetMinValue(channel);
  HwReportHistogramGetMaxValue(channel);
  for (const std::int32_t index : {-1, 0, 1, 2, 3, kFarOutside}) {
    HwReportArrayGetValueAtIndex(channel, index);
    askStates(channel, index);
    askBuckets(channel, index, maker);
  }
  HwReportChannelCopyDescription(channel, 0, "> ");
  HwReportSampleCopyDescription(channel, 0, nullptr);
}

}  // namespace tally::fuzz
