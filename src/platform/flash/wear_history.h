// The history of a disk's wear, which is kept for the life of the disk and never leaves the device.
#pragma once

#include <algorithm>
#include <cstdint>
#include <optional>
#include <span>

#include "platform/flash/wear.h"

namespace tally {

// What a disk said on a day.
struct WearRow {
  std::int32_t day = 0;
  PercentRange used;
  std::optional<std::int64_t> hostBytes, flashBytes;  // written in the disk's life
  bool operator==(const WearRow&) const = default;
};

// Of a disk whose percentage is known; of the day of the figures, which may be before today.
inline std::optional<WearRow> wearRowOf(const Wear& wear, std::int32_t today) {
  const auto& used = wear.mostUsed();
  const std::int64_t day = today - wear.ageSeconds.value_or(0) / kSecondsPerDay;
  if (!used || day < 0) return std::nullopt;
  const auto bytes = [](const Figure<std::uint64_t>& figure) {
    return figure ? std::optional(static_cast<std::int64_t>(
                        std::min<std::uint64_t>(figure->value, INT64_MAX)))
                  : std::nullopt;
  };
  return WearRow{static_cast<std::int32_t>(day), used->value, bytes(wear.hostBytesWritten),
                 bytes(wear.flashBytesWritten)};
}

// Whether the row adds to the history, which is in the order of its days: a percentage that has
// changed, or a week since the last row.
inline bool addsToHistory(std::span<const WearRow> history, const WearRow& row) {
  constexpr std::int32_t kMostDaysWithoutRow = 7;
  // Days to come are from before the clock was set back.
  const auto later = std::ranges::upper_bound(history, row.day, {}, &WearRow::day);
  if (later == history.begin()) return true;
  const WearRow& last = *(later - 1);
  return last.used != row.used || row.day - last.day >= kMostDaysWithoutRow;
}

}  // namespace tally
