// Values of a sampled channel for C.
#include "hwreport/hwreport_c.h"

#include <cmath>

#include "hwreport/c_api/handles.h"
#include "hwreport/channels/raw_element.h"
#include "hwreport/values.h"

namespace tally {
namespace {

static_assert(static_cast<std::int64_t>(kHwReportInvalidValue) == HWREPORT_MISSING);

// How one value of an element is read.
using ElementReader = std::int64_t (*)(KvDictionary* channel, std::int32_t element);
template <auto Get>
std::int64_t readElement(KvDictionary* channel, std::int32_t element) {
  return static_cast<std::int64_t>(Get(channel, element));
}
std::int64_t readLowerBound(KvDictionary* channel, std::int32_t bucket) {
  std::int64_t bound = HWREPORT_MISSING;
  HwReportHistogramGetBucketBounds(channel, bucket, &bound, nullptr);
  return bound;
}
std::int64_t readUpperBound(KvDictionary* channel, std::int32_t bucket) {
  std::int64_t bound = HWREPORT_MISSING;
  HwReportHistogramGetBucketBounds(channel, bucket, nullptr, &bound);
  return bound;
}

struct ElementColumn {
  int column;
  std::uint8_t format;
  ElementReader read;
};
constexpr ElementColumn kElementColumns[] = {
    {HWREPORT_ARRAY_VALUES, HWREPORT_FORMAT_ARRAY, readElement<HwReportArrayGetValueAtIndex>},
    {HWREPORT_STATE_IDS, HWREPORT_FORMAT_STATE, readElement<HwReportStateGetIDForIndex>},
    {HWREPORT_STATE_TRANSITIONS, HWREPORT_FORMAT_STATE, readElement<HwReportStateGetInTransitions>},
    {HWREPORT_STATE_RESIDENCIES, HWREPORT_FORMAT_STATE, readElement<HwReportStateGetResidency>},
    {HWREPORT_BUCKET_HITS, HWREPORT_FORMAT_HISTOGRAM, readElement<HwReportHistogramGetBucketHits>},
    {HWREPORT_BUCKET_MINIMA, HWREPORT_FORMAT_HISTOGRAM,
     readElement<HwReportHistogramGetBucketMinValue>},
    {HWREPORT_BUCKET_MAXIMA, HWREPORT_FORMAT_HISTOGRAM,
     readElement<HwReportHistogramGetBucketMaxValue>},
    {HWREPORT_BUCKET_SUMS, HWREPORT_FORMAT_HISTOGRAM, readElement<HwReportHistogramGetBucketSum>},
    {HWREPORT_BUCKET_LOWER_BOUNDS, HWREPORT_FORMAT_HISTOGRAM, readLowerBound},
    {HWREPORT_BUCKET_UPPER_BOUNDS, HWREPORT_FORMAT_HISTOGRAM, readUpperBound},
};
static_assert(HWREPORT_FORMAT_SIMPLE == kHwReportFormatSimple &&
              HWREPORT_FORMAT_STATE == kHwReportFormatState &&
              HWREPORT_FORMAT_HISTOGRAM == kHwReportFormatHistogram &&
              HWREPORT_FORMAT_ARRAY == kHwReportFormatSimpleArray);

const ElementColumn* findColumn(int column) {
  for (const ElementColumn& row : kElementColumns) {
    if (row.column == column) return &row;
  }
  return nullptr;
}

// How many values a column of that format has; none unless the channel was sampled in the format.
std::optional<std::size_t> lengthOfColumn(const KvDictionary* channel, std::uint8_t format) {
  const bool isArray = format == HWREPORT_FORMAT_ARRAY;
  const auto run = isArray ? runOfFormat(channel, format) : runOfLegend(channel, format);
  if (!run) return std::nullopt;
  return isArray ? std::size_t{run->count()} * element::kSlotCount : std::size_t{run->count()};
}

int noValue(std::string_view text = "the channel has no such value") {
  return cFailure(HWREPORT_NO_VALUE, text);
}

// An index in the functions that count in 32 bits; one that is too large is past every end.
std::int32_t elementIndex(std::size_t index) {
  return index < INT32_MAX ? static_cast<std::int32_t>(index) : INT32_MAX;
}

}  // namespace
}  // namespace tally

using namespace tally;

int hwreport_simple_value(hwreport_channels* channels, size_t index, int64_t* value) {
  return cCall([&] {
    if (!cClear(value)) return cBadArgument("the value's output is NULL");
    const KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const std::int64_t found = HwReportSimpleGetIntegerValue(channel);
    if (found == HWREPORT_MISSING) return noValue();
    *value = found;
    return kCOk;
  });
}

int hwreport_elements(hwreport_channels* channels, size_t index, int column, int64_t* values,
                      size_t capacity, size_t* count) {
  return cCall([&] {
    if (!cClear(count)) return cBadArgument("the count's output is NULL");
    if (values == nullptr && capacity != 0)
      return cBadArgument("there is no memory for the values");
    const ElementColumn* const row = findColumn(column);
    if (row == nullptr) return cBadArgument("no such column");
    KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const auto length = lengthOfColumn(channel, row->format);
    if (!length) return noValue("the channel is not sampled, or of another format");
    for (std::size_t i = 0; i < std::min(*length, capacity); ++i) {
      values[i] = row->read(channel, elementIndex(i));
    }
    *count = *length;
    return kCOk;
  });
}

int hwreport_state_name(hwreport_channels* channels, size_t index, size_t state,
                        const char** name) {
  return cCall([&] {
    if (!cClear(name, "")) return cBadArgument("the name's output is NULL");
    KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const KvString* const found = HwReportStateGetNameForIndex(channel, elementIndex(state));
    if (found == nullptr) return noValue("the state has no name");
    *name = found->view().data();
    return kCOk;
  });
}

int hwreport_state_share(hwreport_channels* channels, size_t index, size_t state, double* share) {
  return cCall([&] {
    if (!cClear(share)) return cBadArgument("the share's output is NULL");
    const KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const double found = HwReportStateGetDutyCycle(channel, elementIndex(state));
    if (std::isnan(found)) return noValue();
    *share = found;
    return kCOk;
  });
}

int hwreport_state_current(hwreport_channels* channels, size_t index, size_t* state) {
  return cCall([&] {
    if (!cClear(state)) return cBadArgument("the state's output is NULL");
    const KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const std::int32_t found = HwReportStateGetCurrent(channel);
    if (found < 0) return noValue();
    *state = static_cast<std::size_t>(found);
    return kCOk;
  });
}

int hwreport_histogram_range(hwreport_channels* channels, size_t index, int64_t* minimum,
                             int64_t* maximum) {
  return cCall([&] {
    cClear(minimum);
    cClear(maximum);
    const KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const std::int64_t least = HwReportHistogramGetMinValue(channel);
    const std::int64_t most = HwReportHistogramGetMaxValue(channel);
    if (least == HWREPORT_MISSING || most == HWREPORT_MISSING) return noValue();
    cClear(minimum, least);
    cClear(maximum, most);
    return kCOk;
  });
}

int hwreport_scale(uint64_t value, uint64_t from_unit, uint64_t to_unit, double* scaled) {
  return cCall([&] {
    if (!cClear(scaled)) return cBadArgument("the value's output is NULL");
    const double found = HwReportScaleValue(value, from_unit, to_unit);
    if (std::isnan(found)) return noValue("one unit cannot be expressed in the other");
    *scaled = found;
    return kCOk;
  });
}
