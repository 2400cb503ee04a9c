// Numbers in the texts of /proc and /sys.
#pragma once

#include <charconv>
#include <cstdint>
#include <limits>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/text_lines.h"
#include "host/kernel/findings.h"

namespace tally {

// Removes the first word from a line and returns it; empty at the end.
inline std::string_view takeWord(std::string_view& line) {
  constexpr std::string_view kBlanks = " \t";
  line.remove_prefix(std::min(line.find_first_not_of(kBlanks), line.size()));
  const std::size_t end = std::min(line.find_first_of(kBlanks), line.size());
  const std::string_view word = line.substr(0, end);
  line.remove_prefix(end);
  return word;
}

// A whole number in decimal; kNoReading for anything else, and beyond 63 bits.
inline std::int64_t readingOf(std::string_view word) {
  std::int64_t value = 0;
  const char* const end = word.data() + word.size();
  const auto [stop, fault] = std::from_chars(word.data(), end, value);
  return fault == std::errc() && stop == end && !word.empty() ? value : kNoReading;
}

// The same of a counter, which is never negative.
inline std::int64_t counterOf(std::string_view word) {
  const std::int64_t value = readingOf(word);
  return value >= 0 ? value : kNoReading;
}

// A reading in another unit; missing if it is or does not fit.
inline std::int64_t scaled(std::int64_t reading, std::int64_t multiplier,
                           std::int64_t divisor = 1) {
  std::int64_t value = 0;
  if (reading == kNoReading || __builtin_mul_overflow(reading, multiplier, &value)) {
    return kNoReading;
  }
  return value / divisor;
}

// The kernel counts processor time in hundredths of a second.
constexpr std::int64_t kMillisecondsPerTick = 10;

// The place of a label among the layout's from the hint on, which is where it is if the file still
// has its order; labels.size() if it is new.
inline std::size_t labelIndex(const FileLayout& layout, std::string_view label, std::size_t& hint) {
  const std::size_t count = layout.labels.size();
  for (std::size_t i = 0; i < count; ++i) {
    const std::size_t place = hint + i < count ? hint + i : hint + i - count;
    if (layout.labels[place] == label) {
      hint = place + 1 < count ? place + 1 : 0;
      return place;
    }
  }
  return count;
}

// Files that are one number: a layout of one field.
inline FileLayout oneField() { return {{""}, 1}; }
inline void parseGauge(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  if (!fields.empty()) fields[0] = readingOf(trimmed(text));
}
inline void parseCounter(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  if (!fields.empty()) fields[0] = counterOf(trimmed(text));
}

}  // namespace tally
