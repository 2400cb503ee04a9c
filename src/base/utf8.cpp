#include "base/utf8.h"

namespace tally {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";  // U+FFFD

// Length of the well-formed sequence that starts at position, or 0.
std::size_t sequenceLength(std::string_view text, std::size_t position) {
  const auto byte = [&](std::size_t i) { return static_cast<std::uint8_t>(text[position + i]); };
  const auto continues = [&](std::size_t i, unsigned low = 0x80, unsigned high = 0xBF) {
    return position + i < text.size() && byte(i) >= low && byte(i) <= high;
  };
  const unsigned lead = byte(0);
  if (lead < 0x80) return 1;
  if (lead >= 0xC2 && lead <= 0xDF) return continues(1) ? 2 : 0;
  if (lead >= 0xE0 && lead <= 0xEF) {
    const unsigned low = lead == 0xE0 ? 0xA0 : 0x80;   // no overlong form
    const unsigned high = lead == 0xED ? 0x9F : 0xBF;  // no surrogate
    return continues(1, low, high) && continues(2) ? 3 : 0;
  }
  if (lead >= 0xF0 && lead <= 0xF4) {
    const unsigned low = lead == 0xF0 ? 0x90 : 0x80;
    const unsigned high = lead == 0xF4 ? 0x8F : 0xBF;  // up to U+10FFFF
    return continues(1, low, high) && continues(2) && continues(3) ? 4 : 0;
  }
  return 0;
}

bool xmlCanCarry(std::string_view character) {
  if (character.size() == 1) {
    const auto byte = static_cast<std::uint8_t>(character[0]);
    return byte >= 0x20 || byte == '\t' || byte == '\n' || byte == '\r';
  }
  return character != "\xEF\xBF\xBE" && character != "\xEF\xBF\xBF";  // U+FFFE, U+FFFF
}

}  // namespace

bool isValidUtf8(std::string_view text) {
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t length = sequenceLength(text, i);
    if (length == 0) return false;
    i += length;
  }
  return true;
}

std::uint32_t takeCharacter(std::string_view text, std::size_t& position) {
  const std::size_t length = sequenceLength(text, position);
  const auto lead = static_cast<std::uint8_t>(text[position++]);
  if (length == 0) return 0xFFFD;
  if (length == 1) return lead;
  std::uint32_t character = lead & (0xFFu >> (length + 1));
  for (std::size_t i = 1; i < length; ++i) {
    character = character << 6 | (static_cast<std::uint8_t>(text[position++]) & 0x3Fu);
  }
  return character;
}

std::string repairUtf8(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t length = sequenceLength(text, i);
    out += length == 0 ? kReplacement : text.substr(i, length);
    i += length == 0 ? 1 : length;
  }
  return out;
}

std::string replaceNonXmlCharacters(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t length = sequenceLength(text, i);
    const auto character = text.substr(i, length == 0 ? 1 : length);
    out += length != 0 && xmlCanCarry(character) ? character : kReplacement;
    i += character.size();
  }
  return out;
}

}  // namespace tally
