// Finds a statistic by its key in the driver's buffer.
#pragma once

#include <cstdint>

namespace tally {

struct Statistic {
  std::uint16_t elements = 0;  // taken from a record
  std::uint16_t name = 0;      // number of the plain name; those of its elements follow
};

// Null when the key is not known; in constant time.
const Statistic* findStatistic(std::uint32_t key) noexcept;

}  // namespace tally
