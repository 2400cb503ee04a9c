// The values of a sampled channel, by its format.
//
// A value that cannot be read (no sample, another format, an index out of range) is
// kHwReportInvalidValue, unless said otherwise. Values are in the channel's unit.
#pragma once

#include <cstdint>

#include "hwreport/channel.h"
#include "hwreport/error.h"
#include "kv/value.h"

namespace tally {

// Simple: one value. *unit, when given, is set if the value was read.
TALLY_API std::int64_t HwReportSimpleGetIntegerValue(const KvDictionary* channel,
                                                     std::uint64_t* unit = nullptr);

// Simple array: four values to an element, numbered through.
TALLY_API std::int64_t HwReportArrayGetValueAtIndex(const KvDictionary* channel,
                                                    std::int32_t index);

// State: how often each state was entered and how long it lasted.
// The number of states; -1 when the channel is of another format.
TALLY_API std::int32_t HwReportStateGetCount(const KvDictionary* channel);
TALLY_API std::uint64_t HwReportStateGetIDForIndex(const KvDictionary* channel, std::int32_t index);
TALLY_API std::uint64_t HwReportStateGetInTransitions(const KvDictionary* channel,
                                                      std::int32_t index);
TALLY_API std::uint64_t HwReportStateGetResidency(const KvDictionary* channel, std::int32_t index);
// The highest index with this id, or -1.
TALLY_API std::int32_t HwReportStateGetIndexForID(const KvDictionary* channel, std::uint64_t id);
// The printable bytes of the state's id; null unless every state of the channel has such a name.
// The names are kept in the channel.
TALLY_API KvString* HwReportStateGetNameForIndex(KvDictionary* channel, std::int32_t index);
// The state's share of all residencies, 0 to 1; NaN when it cannot be read or they are all 0.
TALLY_API double HwReportStateGetDutyCycle(const KvDictionary* channel, std::int32_t index);
// The index of the state that was updated last, or -1.
TALLY_API std::int32_t HwReportStateGetCurrent(const KvDictionary* channel);

// Histogram: what was seen in each bucket.
// The number of buckets; -1 when the channel is of another format.
TALLY_API std::int32_t HwReportHistogramGetBucketCount(const KvDictionary* channel);
TALLY_API std::uint64_t HwReportHistogramGetBucketHits(const KvDictionary* channel,
                                                       std::int32_t index);
TALLY_API std::int64_t HwReportHistogramGetBucketMinValue(const KvDictionary* channel,
                                                          std::int32_t index);
TALLY_API std::int64_t HwReportHistogramGetBucketMaxValue(const KvDictionary* channel,
                                                          std::int32_t index);
TALLY_API std::int64_t HwReportHistogramGetBucketSum(const KvDictionary* channel,
                                                     std::int32_t index);
// Of all buckets that have hits.
TALLY_API std::int64_t HwReportHistogramGetMinValue(const KvDictionary* channel);
TALLY_API std::int64_t HwReportHistogramGetMaxValue(const KvDictionary* channel);
// The borders of a bucket by the channel's configuration; either pointer may be null. HwErrGeneral
// when there is no valid configuration or no such bucket. The bounds are kept in the channel.
TALLY_API HwResult HwReportHistogramGetBucketBounds(KvDictionary* channel, std::int32_t index,
                                                    std::int64_t* lower, std::int64_t* upper);

// The value expressed in another unit; NaN when the quantities differ or a unit cannot be scaled.
TALLY_API double HwReportScaleValue(std::uint64_t value, std::uint64_t fromUnit,
                                    std::uint64_t toUnit);

}  // namespace tally
