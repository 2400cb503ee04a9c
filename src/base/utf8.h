// UTF-8: checks, repair, and text that was UTF-16.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace tally {

// True when text is well-formed UTF-8 (no overlong forms, surrogates or values past U+10FFFF).
bool isValidUtf8(std::string_view text);
// The character that starts at position, which moves past it; U+FFFD for a byte that is not part
// of a well-formed sequence. REQUIRES: position is inside the text.
std::uint32_t takeCharacter(std::string_view text, std::size_t& position);
// REQUIRES: the character is a code point that is not a surrogate.
void appendCharacter(std::string& out, std::uint32_t character);
// Appends the text that the bytes spell in UTF-16. False when half of a character or of a surrogate
// pair is missing; what comes before it has been appended.
bool appendUtf16(std::string& out, std::span<const std::byte> bytes, std::endian order);
// A copy in which every byte that is not part of a well-formed sequence is U+FFFD.
std::string repairUtf8(std::string_view text);
// A copy in which every character that XML 1.0 cannot carry (controls other than tab, newline and
// carriage return, U+FFFE, U+FFFF) is U+FFFD. The text must be valid UTF-8.
std::string replaceNonXmlCharacters(std::string_view text);

}  // namespace tally
