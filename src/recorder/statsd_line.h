// One line of the StatsD protocol: NAME:VALUE[:VALUE...]|TYPE[|@RATE][|#TAGS][|...].
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "recorder/refusal.h"

namespace tally {

enum class LineType : std::uint8_t { Counter, Gauge, Duration, Sample };

struct MetricValue {
  double number = 0;
  std::optional<std::int64_t> whole;  // the number, if it was written without a fraction and fits
  bool isSigned = false;  // written with a sign, which changes a gauge instead of setting it
};

// Its texts borrow from the line.
struct MetricLine {
  std::string_view name, tags;
  LineType type = LineType::Counter;
  double rate = 1;  // in (0, 1]
  std::uint32_t skippedSections = 0;
};

// Reads a line without its newline. The values are all finite, one at least, in the order of the
// line; the vector is reused. Otherwise the reason why the line is not recorded. Whether the name
// is UTF-8 is not looked at.
std::optional<Refusal> parseMetricLine(std::string_view line, MetricLine& metric,
                                       std::vector<MetricValue>& values);

// The tag's value in a list "tag:value,tag,..."; empty when it is not there.
std::optional<std::string_view> tagValue(std::string_view tags, std::string_view tag);

}  // namespace tally
