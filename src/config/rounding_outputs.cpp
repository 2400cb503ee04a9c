#include "config/rounding_outputs.h"

#include <algorithm>
#include <cmath>
#include <vector>

namespace tally {
namespace {

// Values at an even distance, all of which occur.
struct Stretch {
  std::int64_t first, last;
  std::uint64_t spacing;
  double count;
};

std::uint64_t distance(std::int64_t from, std::int64_t to) {
  return static_cast<std::uint64_t>(to) - static_cast<std::uint64_t>(from);
}

std::int64_t plus(std::int64_t value, std::uint64_t amount) {
  return static_cast<std::int64_t>(static_cast<std::uint64_t>(value) + amount);
}

// Adds what a step of the rounding makes of the stretch.
void roundStretch(const Stretch& values, const ScalarRounding& rounding, std::uint32_t setting,
                  std::vector<Stretch>& rounded) {
  double left = values.count;
  for (std::int64_t first = values.first;;) {
    const RoundingGrid grid = rounding.grid(first, setting);
    const bool isLast = grid.last >= values.last;
    const std::uint64_t steps = distance(first, grid.last) / values.spacing;
    const std::int64_t last = isLast ? values.last : plus(first, steps * values.spacing);
    const double count = isLast ? left : static_cast<double>(steps) + 1;
    const std::int64_t from = rounding.round(first, setting), to = rounding.round(last, setting);
    if (grid.step > values.spacing) {
      // Some value is near each point of the grid.
      const double points =
          std::ceil(static_cast<double>(distance(from, to)) / static_cast<double>(grid.step));
      rounded.push_back({from, to, grid.step, points + 1});
    } else {
      // No two values are near one point.
      rounded.push_back({from, to, values.spacing, count});
    }
    if (isLast || distance(last, values.last) < values.spacing) return;
    left -= count;
    first = plus(last, values.spacing);
  }
}

}  // namespace

double outputsBetween(std::int64_t lowest, std::int64_t highest, const ScalarOptions& options) {
  std::vector<Stretch> values = {
      {lowest, highest, 1, static_cast<double>(distance(lowest, highest)) + 1}};
  for (const WhitelistOption& option : whitelistOptions()) {
    if (!option.effect.isForScalars()) continue;
    const auto setting = unsignedOption(options, option.name);
    if (!setting) continue;
    std::vector<Stretch> rounded;
    for (const Stretch& stretch : values) {
      roundStretch(stretch, option.effect.rounding(), *setting, rounded);
    }
    values = std::move(rounded);
  }
  // Stretches have at most their ends in common; or their middle, where no figure is kept and
  // values of every size become 0.
  double inside = 0;
  std::vector<std::int64_t> ends;
  for (const Stretch& stretch : values) {
    const bool hasMiddle = stretch.count == 3;
    if (hasMiddle) ends.push_back(plus(stretch.first, stretch.spacing));
    inside += stretch.count - (stretch.first == stretch.last ? 1 : 2) - (hasMiddle ? 1 : 0);
    ends.push_back(stretch.first);
    ends.push_back(stretch.last);
  }
  std::ranges::sort(ends);
  ends.erase(std::unique(ends.begin(), ends.end()), ends.end());
  return inside + static_cast<double>(ends.size());
}

}  // namespace tally
