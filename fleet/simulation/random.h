// Numbers that depend on nothing but what they are asked for, so that a fleet is the same in
// whatever order, and in however many processes, its devices are simulated.
#pragma once

#include <cmath>
#include <cstdint>
#include <initializer_list>
#include <numbers>

namespace tally::simulation {

class Random {
 public:
  // Of a purpose: the seed of the fleet, a device, a day, whatever tells it from others.
  explicit Random(std::initializer_list<std::uint64_t> purpose) {
    for (const std::uint64_t part : purpose) state_ = scrambled(state_ + kStep + part);
  }

  std::uint64_t bits() { return scrambled(state_ += kStep); }
  // 0 up to, but not including, 1.
  double uniform() { return static_cast<double>(bits() >> 11) * 0x1p-53; }
  std::uint64_t below(std::uint64_t bound) {
    return static_cast<std::uint64_t>(uniform() * static_cast<double>(bound));
  }
  // Of mean 0 and standard deviation 1.
  double normal() {
    const double radius = std::sqrt(-2 * std::log(1 - uniform()));
    return radius * std::cos(2 * std::numbers::pi * uniform());
  }

 private:
  static constexpr std::uint64_t kStep = 0x9E3779B97F4A7C15;
  static std::uint64_t scrambled(std::uint64_t value) {
    value = (value ^ (value >> 30)) * 0xBF58476D1CE4E5B9;
    value = (value ^ (value >> 27)) * 0x94D049BB133111EB;
    return value ^ (value >> 31);
  }

  std::uint64_t state_ = 0;
};

// What numbers are asked for, as a part of their purpose.
enum class Purpose : std::uint64_t { Order, Habits, Machine, Metrics, Samples, Power, Pseudonym };

}  // namespace tally::simulation
