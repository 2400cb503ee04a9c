// Walking text line by line.
#pragma once

#include <algorithm>
#include <cstddef>
#include <string_view>

namespace tally {

// Calls handler(line) for every line, without its newline.
template <class Handler>
void eachLine(std::string_view text, const Handler& handler) {
  for (std::size_t begin = 0; begin < text.size();) {
    const std::size_t end = std::min(text.find('\n', begin), text.size());
    handler(text.substr(begin, end - begin));
    begin = end + 1;
  }
}

// Without the blanks at its ends.
inline std::string_view trimmed(std::string_view text) {
  constexpr std::string_view kBlanks = " \t\r";
  const auto first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

}  // namespace tally
