// UTF-8 checks and repair.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace tally {

// True when text is well-formed UTF-8 (no overlong forms, surrogates or values past U+10FFFF).
bool isValidUtf8(std::string_view text);
// The character that starts at position, which moves behind it; U+FFFD for a byte that is not part
// of a well-formed sequence. REQUIRES: position is inside the text.
std::uint32_t takeCharacter(std::string_view text, std::size_t& position);
// A copy in which every byte that is not part of a well-formed sequence is U+FFFD.
std::string repairUtf8(std::string_view text);
// A copy in which every character that XML 1.0 cannot carry (controls other than tab, newline and
// carriage return, U+FFFE, U+FFFF) is U+FFFD. The text must be valid UTF-8.
std::string replaceNonXmlCharacters(std::string_view text);

}  // namespace tally
