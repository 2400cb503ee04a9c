#include "tools/channels/channel_readings.h"

#include <cmath>
#include <iterator>
#include <limits>

#include <fmt/core.h>

#include "hwreport/channel.h"
#include "hwreport/values.h"
#include "platform/protocol/hub_protocol.h"

namespace tally::tools {
namespace {

std::optional<std::uint64_t> present(std::uint64_t value) {
  return value != kHwReportInvalidValue ? std::optional(value) : std::nullopt;
}

std::optional<std::int64_t> present(std::int64_t value) {
  return value != std::numeric_limits<std::int64_t>::min() ? std::optional(value) : std::nullopt;
}

}  // namespace

std::optional<std::int64_t> readSimple(const KvDictionary& channel) {
  return present(HwReportSimpleGetIntegerValue(&channel));
}

std::vector<StateReading> readStates(KvDictionary& channel) {
  std::vector<StateReading> states;
  const std::int32_t count = HwReportStateGetCount(&channel);
  const std::int32_t current = HwReportStateGetCurrent(&channel);
  // Either all states have names or none has, and each attempt to make a name visits all states.
  const bool named = HwReportStateGetNameForIndex(&channel, 0) != nullptr;
  double total = 0;
  for (std::int32_t i = 0; i < count; ++i) {
    StateReading state;
    state.id = HwReportStateGetIDForIndex(&channel, i);
    const KvString* const name = named ? HwReportStateGetNameForIndex(&channel, i) : nullptr;
    state.name = name != nullptr ? std::string(name->view()) : fmt::format("{:#x}", state.id);
    state.entries = present(HwReportStateGetInTransitions(&channel, i));
    state.residency = present(HwReportStateGetResidency(&channel, i));
    state.isCurrent = i == current;
    total += state.residency ? static_cast<double>(*state.residency) : std::nan("");
    states.push_back(std::move(state));
  }
  // The duty cycle of every single state would add all of them up each time.
  for (StateReading& state : states) {
    const auto part = static_cast<double>(state.residency.value_or(0));
    state.share = total > 0 ? part / total : std::nan("");
  }
  return states;
}

std::vector<BucketReading> readBuckets(KvDictionary& channel) {
  std::vector<BucketReading> buckets;
  const std::int32_t count = HwReportHistogramGetBucketCount(&channel);
  bool bounded = true;  // the bounds of a bucket without them are not worked out again for the next
  for (std::int32_t i = 0; i < count; ++i) {
    BucketReading bucket;
    std::int64_t lower = 0, upper = 0;
    bounded = bounded && HwReportHistogramGetBucketBounds(&channel, i, &lower, &upper) == 0;
    if (bounded) {
      bucket.lower = lower;
      bucket.upper = upper;
    }
    bucket.hits = present(HwReportHistogramGetBucketHits(&channel, i));
    bucket.minimum = present(HwReportHistogramGetBucketMinValue(&channel, i));
    bucket.maximum = present(HwReportHistogramGetBucketMaxValue(&channel, i));
    bucket.sum = present(HwReportHistogramGetBucketSum(&channel, i));
    buckets.push_back(bucket);
  }
  return buckets;
}

std::vector<std::optional<std::int64_t>> readArray(const KvDictionary& channel) {
  std::vector<std::optional<std::int64_t>> values;
  const auto* raw = channel.getAs<KvData>("RawElements");
  const std::size_t count =
      raw != nullptr ? raw->bytes().size() / element::kSize * element::kSlotCount : 0;
  for (std::size_t i = 0; i < count; ++i) {
    values.push_back(present(HwReportArrayGetValueAtIndex(&channel, static_cast<std::int32_t>(i))));
  }
  while (!values.empty() && !values.back()) values.pop_back();
  return values;
}

std::string channelName(KvDictionary& channel) {
  const KvString* const name = HwReportChannelGetChannelName(&channel);
  return name != nullptr ? std::string(name->view())
                         : fmt::format("{:#x}", HwReportChannelGetChannelID(&channel));
}

const KvDictionary* channelDetails(const KvDictionary& channel) {
  const auto* const line = channel.getAs<KvArray>("LegendChannel");
  return line != nullptr ? line->getAs<KvDictionary>(kLegendDetails) : nullptr;
}

std::string textOf(const KvString* text) {
  return text != nullptr ? std::string(text->view()) : std::string();
}

std::string_view formatName(std::uint8_t format) {
  static constexpr std::string_view kNames[] = {"unknown", "simple", "state", "histogram", "array"};
  return format < std::size(kNames) ? kNames[format] : kNames[0];
}

}  // namespace tally::tools
