// Words in the tables of /proc.
#pragma once

#include <string>
#include <string_view>

namespace tally {

// The kernel writes blanks and the like in octal: "a\040b" is "a b".
inline std::string unescaped(std::string_view text) {
  std::string plain;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const auto isOctal = [&](std::size_t at) {
      return at < text.size() && text[at] >= '0' && text[at] <= '7';
    };
    if (text[i] == '\\' && isOctal(i + 1) && isOctal(i + 2) && isOctal(i + 3)) {
      const int code = (text[i + 1] - '0') * 64 + (text[i + 2] - '0') * 8 + (text[i + 3] - '0');
      plain += static_cast<char>(code);
      i += 3;
    } else {
      plain += text[i];
    }
  }
  return plain;
}

}  // namespace tally
