// Values and bounds of histogram channels.
#include "hwreport/values.h"

#include <algorithm>

#include "base/byte_reader.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/raw_element.h"

namespace tally {
namespace {

std::uint64_t slotOfBucket(const KvDictionary* channel, std::int32_t index, std::size_t slot) {
  return slotOfLegendRun(channel, kHwReportFormatHistogram, index, slot);
}

constexpr std::int64_t asSigned(std::uint64_t value) { return static_cast<std::int64_t>(value); }

// The bucket configuration: records of segments.
constexpr std::size_t kRecordSize = 16;
constexpr std::size_t kRecordBase = 0;       // 32 bits: step or ratio
constexpr std::size_t kRecordGeometric = 4;  // 32 bits: a ratio, not a step
constexpr std::size_t kRecordBuckets = 12;   // 32 bits, signed

struct Segment {
  std::uint32_t base = 0;
  bool geometric = false;
  std::int32_t buckets = 0;
};

// Appends the upper bounds of a segment. False when there are too many or they do not rise.
bool appendBounds(const Segment& segment, std::size_t bucketCount, std::uint64_t* previous,
                  KvArray& bounds) {
  std::uint64_t power = 1;
  for (std::int32_t j = 0; j < segment.buckets; ++j) {
    if (bounds.size() >= bucketCount) return false;
    power *= segment.base;  // modulo 2 to the power of 64; a bound that wraps does not rise
    const std::uint32_t multiple = segment.base * (static_cast<std::uint32_t>(j) + 1);
    const std::uint64_t bound = segment.geometric ? power : multiple;
    if (bound <= *previous) return false;
    bounds.append(KvNumber::uint64(bound));
    *previous = bound;
  }
  return true;
}

KvRef<KvArray> makeBounds(const KvDictionary* channel) {
  const std::int32_t buckets = HwReportHistogramGetBucketCount(channel);
  const auto* const information = channel->getAs<KvDictionary>(*keys().channelInfo);
  const auto* const config =
      information != nullptr ? information->getAs<KvData>(*keys().channelConfig) : nullptr;
  if (buckets < 0 || config == nullptr || config->bytes().size() < kRecordSize) return nullptr;
  const ByteReader reader(config->bytes());
  auto bounds = KvArray::create(static_cast<std::size_t>(buckets));
  std::uint64_t previous = 0;
  for (std::size_t at = 0; reader.has(at, kRecordSize); at += kRecordSize) {
    const Segment segment = {reader.read<std::uint32_t>(at + kRecordBase).value_or(0),
                             reader.read<std::uint32_t>(at + kRecordGeometric).value_or(0) != 0,
                             reader.read<std::int32_t>(at + kRecordBuckets).value_or(0)};
    if (!appendBounds(segment, static_cast<std::size_t>(buckets), &previous, *bounds)) {
      return nullptr;
    }
  }
  return bounds;
}

}  // namespace

std::int32_t HwReportHistogramGetBucketCount(const KvDictionary* channel) {
  return countOfFormat(channel, kHwReportFormatHistogram);
}

std::uint64_t HwReportHistogramGetBucketHits(const KvDictionary* channel, std::int32_t index) {
  return slotOfBucket(channel, index, bucket_slot::kHits);
}

std::int64_t HwReportHistogramGetBucketMinValue(const KvDictionary* channel, std::int32_t index) {
  return asSigned(slotOfBucket(channel, index, bucket_slot::kMinimum));
}

std::int64_t HwReportHistogramGetBucketMaxValue(const KvDictionary* channel, std::int32_t index) {
  return asSigned(slotOfBucket(channel, index, bucket_slot::kMaximum));
}

std::int64_t HwReportHistogramGetBucketSum(const KvDictionary* channel, std::int32_t index) {
  return asSigned(slotOfBucket(channel, index, bucket_slot::kSum));
}

std::int64_t HwReportHistogramGetMinValue(const KvDictionary* channel) {
  const auto run = runOfLegend(channel, kHwReportFormatHistogram);
  for (std::size_t i = 0; run && i < run->count(); ++i) {
    if (run->slot(i, bucket_slot::kHits) != 0) return asSigned(run->slot(i, bucket_slot::kMinimum));
  }
  return asSigned(kHwReportInvalidValue);
}

std::int64_t HwReportHistogramGetMaxValue(const KvDictionary* channel) {
  const auto run = runOfLegend(channel, kHwReportFormatHistogram);
  for (std::size_t i = run ? run->count() : 0; i-- > 0;) {
    if (run->slot(i, bucket_slot::kHits) != 0) return asSigned(run->slot(i, bucket_slot::kMaximum));
  }
  return asSigned(kHwReportInvalidValue);
}

HwResult HwReportHistogramGetBucketBounds(KvDictionary* channel, std::int32_t index,
                                          std::int64_t* lower, std::int64_t* upper) {
  if (channel == nullptr || index < 0) return HwErrGeneral;
  if (!channel->get(*keys().processedConfig)) {
    channel->set(keys().processedConfig, makeBounds(channel));
  }
  const auto* const bounds = channel->getAs<KvArray>(*keys().processedConfig);
  const auto at = static_cast<std::size_t>(index);
  const auto* const above = bounds != nullptr ? bounds->getAs<KvNumber>(at) : nullptr;
  const auto* const below = above != nullptr && at > 0 ? bounds->getAs<KvNumber>(at - 1) : nullptr;
  if (above == nullptr || (at > 0 && below == nullptr)) return HwErrGeneral;
  if (lower != nullptr) *lower = below != nullptr ? below->asInt64() : 0;
  if (upper != nullptr) *upper = above->asInt64();
  return 0;
}

}  // namespace tally
