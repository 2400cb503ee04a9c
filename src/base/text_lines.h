// Walking text line by line.
#pragma once

#include <algorithm>
#include <cstddef>
#include <string_view>

namespace tally {

// Removes the first line from the text, with its newline, and returns it without. The last line may
// lack its newline. REQUIRES: the text is not empty.
inline std::string_view takeLine(std::string_view& text) {
  const std::size_t end = std::min(text.find('\n'), text.size());
  const std::string_view line = text.substr(0, end);
  text.remove_prefix(std::min(end + 1, text.size()));
  return line;
}

// Calls handler(line) for each line, without its newline.
template <class Handler>
void eachLine(std::string_view text, const Handler& handler) {
  while (!text.empty()) handler(takeLine(text));
}

// Without the white space at its ends.
inline std::string_view trimmed(std::string_view text) {
  constexpr std::string_view kBlanks = " \t\r\n";
  const auto first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

}  // namespace tally
