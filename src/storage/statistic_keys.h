// What is known of a statistic, by its key.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tally {

// One row of the key table, with its place in the pool of counter names.
struct Statistic {
  bool isArray = false;
  std::uint16_t maximum = 1;        // elements taken
  std::uint16_t nameLength = 0;     // of the plain name
  std::uint16_t elementStride = 0;  // from one element's name to the next
  std::uint32_t name = 0;           // place of the plain name; the elements' names follow it
};

// Null when the key is not known; in constant time.
const Statistic* findStatistic(std::uint32_t key) noexcept;

// The name without an index, and that of an element of an array (index < maximum, maximum > 1).
// A zero byte follows the text, which lives as long as the program.
std::string_view statisticName(const Statistic& statistic) noexcept;
std::string_view statisticElementName(const Statistic& statistic, std::size_t index) noexcept;

}  // namespace tally
