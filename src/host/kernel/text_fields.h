// Numbers in the texts of /proc and /sys.
#pragma once

#include <charconv>
#include <cstdint>
#include <limits>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/text_lines.h"
#include "host/kernel/findings.h"

namespace tally {

// Removes the first word from a line and returns it; empty at the end.
inline std::string_view takeWord(std::string_view& line) {
  const auto isBlank = [](char letter) { return letter == ' ' || letter == '\t'; };
  std::size_t begin = 0;
  while (begin < line.size() && isBlank(line[begin])) ++begin;
  std::size_t end = begin;
  while (end < line.size() && !isBlank(line[end])) ++end;
  const std::string_view word = line.substr(begin, end - begin);
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

// Files that are one number.
inline void parseGauge(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  if (!fields.empty()) fields[0] = readingOf(trimmed(text));
}
inline void parseCounter(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  if (!fields.empty()) fields[0] = counterOf(trimmed(text));
}

// A line of numbers by their place.
inline void parseNumbers(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  std::string_view line = text.substr(0, text.find('\n'));
  for (std::int64_t& field : fields) {
    const std::string_view word = takeWord(line);
    if (word.empty()) return;
    field = counterOf(word);
  }
}

// How many numbers a kernel has in such a line; most if that cannot be read now.
inline std::size_t numberCount(const std::optional<std::string>& text, std::size_t most) {
  std::string_view line = text ? std::string_view(*text).substr(0, text->find('\n')) : "";
  std::size_t count = 0;
  while (count < most && !takeWord(line).empty()) ++count;
  return count > 0 ? count : most;
}

// Lines of a name, with or without a colon, and numbers: as many as the layout has columns, the
// rest of a line is of no interest.
inline void parseNamedNumbers(std::string_view text, const FileLayout& layout,
                              std::span<std::int64_t> fields) {
  std::size_t hint = 0;
  eachLine(text, [&](std::string_view line) {
    std::string_view name = takeWord(line);
    if (name.ends_with(':')) name.remove_suffix(1);
    const std::size_t place = labelIndex(layout, name, hint);
    if (place == layout.labels.size()) return;
    for (std::size_t column = 0; column < layout.columns; ++column) {
      const std::string_view word = takeWord(line);
      if (word.empty()) break;
      fields[place * layout.columns + column] = counterOf(word);
    }
  });
}

}  // namespace tally
