#include "storage/nand_info/analytics_day.h"

#include <array>
#include <cmath>
#include <optional>

#include "base/time_text.h"
#include "platform/platform.h"

namespace tally {
namespace {

constexpr std::size_t kBootSessionCapacity = 100;

// The first character of the boot session identifier; a zero byte of an empty one. Empty when
// there is no identifier.
std::optional<char> bootSessionInitial() {
  std::array<std::byte, kBootSessionCapacity> text{};
  std::size_t length = text.size();
  if (platform().kernelValues->readKernelValue("kern.bootsessionuuid", text, &length) != 0) {
    return std::nullopt;
  }
  return length == 0 ? '\0' : static_cast<char>(text[0]);
}

// Anything but an upper-case hexadecimal digit counts as even.
bool isOddDigit(char digit) {
  if (digit >= '0' && digit <= '9') return (digit & 1) != 0;
  if (digit >= 'A' && digit <= 'F') return ((digit + 1) & 1) != 0;
  return false;
}

}  // namespace

bool isAnalyticsDay() {
  const std::optional<char> initial = bootSessionInitial();
  if (!initial) return false;
  const double day = std::floor(platform().clock->secondsSince1970() / kSecondsPerDay);
  const bool isOddDay = std::fmod(day, 2.0) != 0.0;
  return isOddDay == isOddDigit(*initial);
}

}  // namespace tally
