#include "base/utf8.h"

#include <cstring>

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

constexpr bool isHighSurrogate(std::uint32_t unit) { return unit >> 10 == 0xD800 >> 10; }
constexpr bool isLowSurrogate(std::uint32_t unit) { return unit >> 10 == 0xDC00 >> 10; }

bool xmlCanCarry(std::string_view character) {
  if (character.size() == 1) {
    const auto byte = static_cast<std::uint8_t>(character[0]);
    return byte >= 0x20 || byte == '\t' || byte == '\n' || byte == '\r';
  }
  return character != "\xEF\xBF\xBE" && character != "\xEF\xBF\xBF";  // U+FFFE, U+FFFF
}

}  // namespace

bool isValidUtf8(std::string_view text) {
  // Nearly all text is ASCII: eight bytes at a time while their top bits are clear.
  constexpr std::uint64_t kTopBits = 0x8080808080808080;
  std::uint64_t word = 0;
  for (std::size_t i = 0; i < text.size();) {
    if (text.size() - i >= sizeof word) {
      std::memcpy(&word, text.data() + i, sizeof word);
      if ((word & kTopBits) == 0) {
        i += sizeof word;
        continue;
      }
    }
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

void appendCharacter(std::string& out, std::uint32_t character) {
  const auto continuation = [&](int shift) {
    out += static_cast<char>(0x80 | (character >> shift & 0x3F));
  };
  if (character < 0x80) {
    out += static_cast<char>(character);
  } else if (character < 0x800) {
    out += static_cast<char>(0xC0 | character >> 6);
    continuation(0);
  } else if (character < 0x10000) {
    out += static_cast<char>(0xE0 | character >> 12);
    continuation(6);
    continuation(0);
  } else {
    out += static_cast<char>(0xF0 | character >> 18);
    continuation(12);
    continuation(6);
    continuation(0);
  }
}

bool appendUtf16(std::string& out, std::span<const std::byte> bytes, std::endian order) {
  const auto unitAt = [&](std::size_t i) {
    const auto first = std::to_integer<std::uint32_t>(bytes[i]);
    const auto second = std::to_integer<std::uint32_t>(bytes[i + 1]);
    return order == std::endian::big ? first << 8 | second : second << 8 | first;
  };
  std::size_t i = 0;
  for (; i + 1 < bytes.size(); i += 2) {
    std::uint32_t character = unitAt(i);
    if (isLowSurrogate(character)) return false;
    if (isHighSurrogate(character)) {
      i += 2;
      if (i + 1 >= bytes.size() || !isLowSurrogate(unitAt(i))) return false;
      character = 0x10000 + ((character & 0x3FF) << 10) + (unitAt(i) & 0x3FF);
    }
    appendCharacter(out, character);
  }
  return i == bytes.size();
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
