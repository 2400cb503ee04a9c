// The inverse of rounding: which true values a reported scalar can stand for.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "config/whitelist_options.h"

namespace tally {

struct TrueValues {
  std::int64_t lowest = 0, highest = 0;  // both are rounded to the reported value
  bool hasGaps = false;                  // some values between them are rounded to another
};

// The inverse of roundScalar for one set of options. Making it costs some thousand roundings, and
// looking a value up some dozens, so keep one for each whitelist entry.
class RoundingInverse {
 public:
  explicit RoundingInverse(const ScalarOptions& options);
  // False: every value is reported as it is.
  bool rounds() const { return !steps_.empty(); }
  // Empty when no value is rounded to this one, so it was not reported with these options.
  std::optional<TrueValues> trueValues(std::int64_t reported) const;

 private:
  struct Step {
    ScalarRounding rounding;
    std::uint32_t setting;
  };
  // A run of values over which the rounding is monotonic, and its results at both ends.
  struct Piece {
    std::int64_t first, last;
    std::int64_t atFirst, atLast;
  };

  std::int64_t apply(std::int64_t value, std::size_t steps) const;
  void splitPieces(std::size_t step);
  std::vector<Step> steps_;
  std::vector<Piece> pieces_;  // in order, without a gap
};

// For a single value.
std::optional<TrueValues> trueValues(std::int64_t reported, const ScalarOptions& options);

}  // namespace tally
