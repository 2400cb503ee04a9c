// Which days the metrics store forgets.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

namespace tally {

// Each stretch of days keeps this many.
constexpr std::size_t kDaysKept = 30;
// The most days that hold data, and the most that their pages take together.
constexpr std::size_t kMostDaysKept = 366;
constexpr std::uint64_t kMostStoreBytes = std::uint64_t{512} << 20;

// The clock may be wrong, now or whenever a day was recorded, and nothing in the store says when.
// Days that follow each other without a long pause are therefore taken together, as a stretch that
// one clock recorded, and only days of a day's own stretch make it old.

// The first day that is kept, when older ones go: a day goes once kDaysKept days of one stretch
// hold data, all of them later than that day and none in the future. days is ordered from the
// newest on.
std::optional<std::int32_t> firstDayKept(std::span<const std::int32_t> days, std::int32_t today);

// The days that may go while there are too many or the store is too large, in the order in which
// they go: first those that no clock can have recorded rightly, then those of the shortest stretch.
// Today and yesterday, which is still to be reported, are not among them.
std::vector<std::int32_t> leastCredibleDays(std::span<const std::int32_t> days, std::int32_t today);

}  // namespace tally
