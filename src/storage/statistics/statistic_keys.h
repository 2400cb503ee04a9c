// What is known of a statistic, by its key.
#pragma once

#include <cstddef>
#include <cstdint>

namespace tally {

struct Statistic {
  bool isArray = false;
  std::uint16_t maximum = 0;  // elements taken; 1 for a scalar
  std::uint16_t name = 0;     // number of the plain name; those of its elements follow
};

// False when the key is not known; in constant time.
bool findStatistic(std::uint32_t key, Statistic* statistic) noexcept;

}  // namespace tally
