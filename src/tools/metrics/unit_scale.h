// Units of time and of data, and in which of them boundaries were probably meant.
#pragma once

#include <cstdint>
#include <string_view>

namespace tally::tools {

enum class UnitQuantity { Time, Data };
struct UnitScale {
  std::string_view name;
  UnitQuantity quantity;
  double size;  // in seconds or bytes
};

// Null unless it is a unit of time or data. Knows the usual names: "ms", "milliseconds".
const UnitScale* unitScale(std::string_view unit);

// Samples that were seen; NaN and infinite ones are not among them.
struct SampleRange {
  double minimum = 0, maximum = 0, mean = 0;
  std::int64_t count = 0;
};

// The unit in which a histogram's boundaries divide the samples, where in the metric's own unit all
// samples are on the same side of all boundaries. Null when they divide them, when no unit does
// better, and for too few samples. REQUIRES: first <= last.
const UnitScale* likelierUnit(const UnitScale& own, double first, double last,
                              const SampleRange& samples);

}  // namespace tally::tools
