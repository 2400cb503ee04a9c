// The values that a rounded one can stand for: by definition, those that are rounded to it.
#include "config/rounding_range.h"

#include <gtest/gtest.h>

#include <limits>
#include <set>

namespace tally {
namespace {

constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();

// Small ones, and those around powers of ten and two, where digits and doubles change.
std::set<std::int64_t> interestingValues() {
  std::set<std::int64_t> values{kLeast, kLeast + 1, kMost - 1, kMost};
  for (std::int64_t value = -220; value <= 220; ++value) values.insert(value);
  const auto addAround = [&values](std::int64_t centre) {
    for (std::int64_t offset = -4; offset <= 4; ++offset) {
      values.insert({centre + offset, -centre + offset, centre / 2 + offset});
    }
  };
  for (std::int64_t power = 1000; power <= kMost / 10; power *= 10) addAround(power);
  for (int bit = 11; bit < 63; ++bit) addAround(std::int64_t{1} << bit);
  return values;
}

TEST(RoundingInverse, FindsTheEndsOfWhatIsRoundedToAValue) {
  const auto values = interestingValues();
  constexpr std::uint32_t kUnset = std::numeric_limits<std::uint32_t>::max();
  for (const std::uint32_t interval : {kUnset, 0U, 1U, 2U, 7U, 10U, 1000U, kUnset - 1}) {
    for (const std::uint32_t figures : {kUnset, 0U, 1U, 2U, 5U, 14U, 15U, 16U, 18U, 19U}) {
      auto options = ScalarOptions::create();
      if (interval != kUnset) options->set("bucket_interval", KvNumber::int64(interval));
      if (figures != kUnset) options->set("sig_fig", KvNumber::int64(figures));
      const RoundingInverse inverse(*options);
      for (auto value = values.begin(); value != values.end(); ++value) {
        const std::int64_t reported = roundScalar(*value, *options);
        const auto found = inverse.trueValues(reported);
        const auto rounded = [&options](std::int64_t other) {
          return roundScalar(other, *options);
        };
        const auto next = std::next(value);
        ASSERT_TRUE(found && found->lowest <= *value && found->highest >= *value &&
                    rounded(found->lowest) == reported && rounded(found->highest) == reported &&
                    (found->lowest == kLeast || rounded(found->lowest - 1) != reported) &&
                    (found->highest == kMost || rounded(found->highest + 1) != reported) &&
                    (found->hasGaps || next == values.end() || *next > found->highest ||
                     rounded(*next) == reported))
            << *value << kvText(options.get());
      }
    }
  }
}

TEST(RoundingInverse, AnswersByHand) {
  const auto options = [](std::optional<int> interval, std::optional<int> figures) {
    auto made = ScalarOptions::create();
    if (interval) made->set("bucket_interval", KvNumber::int64(*interval));
    if (figures) made->set("sig_fig", KvNumber::int64(*figures));
    return made;
  };
  const struct {
    std::int64_t reported;
    KvRef<KvDictionary> options;
    std::int64_t lowest, highest;
    bool hasGaps;
  } cases[] = {
      {20, options(10, {}), 15, 24, false},
      {0, options(10, {}), -14, 4, false},  // negative sums are rounded toward zero
      {1200, options({}, 2), 1150, 1249, false},
      {100, options({}, 1), 95, 149, false},
      {1000, options(100, 1), 950, 1449, false},
      {10, options({}, 0), 5, 10, false},
      {0, options({}, 0), -4999999999999999487, 4999999999999999487, true},
      {5, options({}, {}), 5, 5, false},
  };
  for (const auto& c : cases) {
    const auto found = trueValues(c.reported, *c.options);
    ASSERT_TRUE(found);
    EXPECT_EQ(std::tuple(found->lowest, found->highest, found->hasGaps),
              std::tuple(c.lowest, c.highest, c.hasGaps))
        << c.reported << kvText(c.options.get());
  }
  EXPECT_FALSE(trueValues(7, *options(10, {}))) << "not a multiple";
}

}  // namespace
}  // namespace tally
