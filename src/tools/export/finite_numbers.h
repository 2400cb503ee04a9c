// The numbers of a row that its format can carry, and notes about the others.
#pragma once

#include <cmath>
#include <cstddef>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/number_text.h"
#include "tools/export/bucket_label.h"

namespace tally::tools {

class FiniteNumbers {
 public:
  // For the next row.
  void clear() { notes_.clear(); }
  // Empty for a NaN or an infinity, which is noted under the name.
  std::optional<double> number(std::string_view name, double value) {
    if (std::isfinite(value)) return value;
    std::string& note = notes_.emplace_back(name);
    appendDouble(note += '=', value);
    return std::nullopt;
  }
  // Likewise for the bounds of a bucket; an open end is empty, and nothing to note.
  std::optional<double> lower(const BucketBounds& bounds, std::size_t index) {
    return bound("lower", bounds.lower, -std::numeric_limits<double>::infinity(), index);
  }
  std::optional<double> upper(const BucketBounds& bounds, std::size_t index) {
    return bound("upper", bounds.upper, std::numeric_limits<double>::infinity(), index);
  }
  // "mean=nan", "lower[1]=inf".
  const std::vector<std::string>& notes() const { return notes_; }

 private:
  std::optional<double> bound(const char* name, double value, double open, std::size_t index) {
    if (std::isfinite(value)) return value;
    if (value == open) return std::nullopt;
    return number(std::string(name) + '[' + std::to_string(index) + ']', value);
  }
  std::vector<std::string> notes_;
};

}  // namespace tally::tools
