#include "hwreport/values/state_values.h"

#include <limits>

#include "hwreport/channels/keys.h"
#include "hwreport/channels/naming.h"
#include "hwreport/channels/raw_element.h"
#include "hwreport/values.h"

namespace tally {
namespace {

std::uint64_t slotOfState(const KvDictionary* channel, std::int32_t index, std::size_t slot) {
  return slotOfLegendRun(channel, kHwReportFormatState, index, slot);
}

// Null unless every state has a name.
KvRef<KvArray> makeStateNames(const KvDictionary* channel) {
  const auto run = runOfLegend(channel, kHwReportFormatState);
  if (!run) return nullptr;
  auto names = KvArray::create(run->count());
  for (std::size_t i = 0; i < run->count(); ++i) {
    const std::uint64_t id = run->slot(i, state_slot::kID);
    auto name = id != kHwReportInvalidValue ? nameOfID(id) : nullptr;
    if (!name) return nullptr;
    names->append(std::move(name));
  }
  return names;
}

}  // namespace

std::optional<std::uint64_t> totalResidency(const KvDictionary* channel) {
  const auto run = runOfLegend(channel, kHwReportFormatState);
  if (!run) return std::nullopt;
  std::uint64_t total = 0;
  for (std::size_t i = 0; i < run->count(); ++i) {
    const std::uint64_t residency = run->slot(i, state_slot::kResidency);
    if (residency == kHwReportInvalidValue) return std::nullopt;
    total += residency;
  }
  return total != 0 ? std::optional(total) : std::nullopt;
}

double dutyCycle(std::uint64_t residency, std::optional<std::uint64_t> total) {
  if (!total || residency == kHwReportInvalidValue) {
    return std::numeric_limits<double>::quiet_NaN();
  }
  return static_cast<double>(residency) / static_cast<double>(*total);
}

std::int32_t HwReportStateGetCount(const KvDictionary* channel) {
  return countOfFormat(channel, kHwReportFormatState);
}

std::uint64_t HwReportStateGetIDForIndex(const KvDictionary* channel, std::int32_t index) {
  return slotOfState(channel, index, state_slot::kID);
}

std::uint64_t HwReportStateGetInTransitions(const KvDictionary* channel, std::int32_t index) {
  return slotOfState(channel, index, state_slot::kInTransitions);
}

std::uint64_t HwReportStateGetResidency(const KvDictionary* channel, std::int32_t index) {
  return slotOfState(channel, index, state_slot::kResidency);
}

std::int32_t HwReportStateGetIndexForID(const KvDictionary* channel, std::uint64_t id) {
  const auto run = runOfLegend(channel, kHwReportFormatState);
  if (!run) return -1;
  for (std::int32_t i = run->count() - 1; i >= 0; --i) {
    if (run->slot(static_cast<std::size_t>(i), state_slot::kID) == id) return i;
  }
  return -1;
}

KvString* HwReportStateGetNameForIndex(KvDictionary* channel, std::int32_t index) {
  if (channel == nullptr || index < 0) return nullptr;
  if (!channel->get(*keys().stateNames)) {
    channel->set(keys().stateNames, makeStateNames(channel));
  }
  const auto* const names = channel->getAs<KvArray>(*keys().stateNames);
  return names != nullptr ? names->getAs<KvString>(static_cast<std::size_t>(index)) : nullptr;
}

double HwReportStateGetDutyCycle(const KvDictionary* channel, std::int32_t index) {
  return dutyCycle(HwReportStateGetResidency(channel, index), totalResidency(channel));
}

std::int32_t HwReportStateGetCurrent(const KvDictionary* channel) {
  const auto run = runOfLegend(channel, kHwReportFormatState);
  if (!run) return -1;
  std::int32_t current = -1;
  std::uint64_t latest = 0;
  for (std::int32_t i = 0; i < run->count(); ++i) {
    const std::uint64_t time = run->updateTime(static_cast<std::size_t>(i));
    if (time <= latest) continue;
    latest = time;
    current = i;
  }
  return current;
}

}  // namespace tally
