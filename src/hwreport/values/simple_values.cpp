// Values of simple and simple array channels.
#include "hwreport/values.h"

#include "hwreport/channels/raw_element.h"

namespace tally {
namespace {

constexpr auto kInvalid = static_cast<std::int64_t>(kHwReportInvalidValue);

}  // namespace

std::int64_t HwReportSimpleGetIntegerValue(const KvDictionary* channel, std::uint64_t* unit) {
  const auto run = runOfFormat(channel, kHwReportFormatSimple);
  if (!run || run->count() != 1) return kInvalid;
  if (unit != nullptr) *unit = HwReportChannelGetUnit(channel);
  return static_cast<std::int64_t>(run->slot(0, simple_slot::kValue));
}

std::int64_t HwReportArrayGetValueAtIndex(const KvDictionary* channel, std::int32_t index) {
  const auto run = runOfFormat(channel, kHwReportFormatSimpleArray);
  if (!run || index < 0) return kInvalid;
  const auto position = static_cast<std::size_t>(index);
  if (position / element::kSlotCount >= run->count()) return kInvalid;
  return static_cast<std::int64_t>(
      run->slot(position / element::kSlotCount, position % element::kSlotCount));
}

}  // namespace tally
