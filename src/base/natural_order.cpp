#include "base/natural_order.h"

#include <algorithm>

namespace tally {
namespace {

bool isDigit(char c) { return c >= '0' && c <= '9'; }

// Takes the digits at the front of the text, without leading zeros.
std::string_view takeNumber(std::string_view& text) {
  const std::size_t end = std::min(text.find_first_not_of("0123456789"), text.size());
  std::string_view number = text.substr(0, end);
  text.remove_prefix(end);
  number.remove_prefix(std::min(number.find_first_not_of('0'), number.size()));
  return number;
}

}  // namespace

bool naturalLess(std::string_view a, std::string_view b) {
  std::string_view left = a, right = b;
  while (!left.empty() && !right.empty()) {
    if (isDigit(left.front()) && isDigit(right.front())) {
      const std::string_view x = takeNumber(left), y = takeNumber(right);
      if (x.size() != y.size()) return x.size() < y.size();
      if (x != y) return x < y;
      continue;
    }
    const auto x = static_cast<unsigned char>(left.front());
    const auto y = static_cast<unsigned char>(right.front());
    if (x != y) return x < y;
    left.remove_prefix(1);
    right.remove_prefix(1);
  }
  if (left.empty() != right.empty()) return left.empty();
  return a < b;
}

}  // namespace tally
