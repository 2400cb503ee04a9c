#include "host/store/store_retention.h"

#include <algorithm>
#include <tuple>

#include "platform/clock.h"

namespace tally {
namespace {

// Days further apart belong to two stretches: the device was off, or its clock jumped.
constexpr std::int64_t kLongestPause = 30;

bool followsWithoutPause(std::int32_t later, std::int32_t earlier) {
  return std::int64_t{later} - earlier <= kLongestPause;
}

}  // namespace

std::optional<std::int32_t> firstDayKept(std::span<const std::int32_t> days, std::int32_t today) {
  std::size_t stretch = 0;
  std::int32_t later = 0;
  for (const std::int32_t day : days) {
    if (day > today) continue;
    stretch = stretch > 0 && followsWithoutPause(later, day) ? stretch + 1 : 1;
    if (stretch == kDaysKept) return day > days.back() ? std::optional(day) : std::nullopt;
    later = day;
  }
  return std::nullopt;
}

std::vector<std::int32_t> leastCredibleDays(std::span<const std::int32_t> days,
                                            std::int32_t today) {
  struct Candidate {
    std::size_t credibility;
    std::int64_t nearness;  // of its stretch to today
    std::int32_t day;
    bool operator<(const Candidate& other) const {
      return std::tie(credibility, nearness, day) <
             std::tie(other.credibility, other.nearness, other.day);
    }
  };
  std::vector<Candidate> candidates;
  for (std::size_t begin = 0, end = 0; begin < days.size(); begin = end) {
    std::int64_t distance = std::int64_t{1} << 32;
    for (end = begin; end < days.size(); ++end) {
      if (end > begin && !followsWithoutPause(days[end - 1], days[end])) break;
      distance = std::min(distance, std::abs(std::int64_t{days[end]} - today));
    }
    const std::size_t length = std::min(end - begin, kDaysKept);
    for (const std::int32_t day : days.subspan(begin, end - begin)) {
      if (day == today || day == today - 1) continue;
      candidates.push_back({day < kFirstPlausibleDay ? 0 : length, -distance, day});
    }
  }
  std::ranges::sort(candidates, std::less<>());
  std::vector<std::int32_t> order;
  order.reserve(candidates.size());
  for (const Candidate& candidate : candidates) order.push_back(candidate.day);
  return order;
}

}  // namespace tally
