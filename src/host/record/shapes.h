// Identifiers that are known by their shape, wherever they are in a text.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tally {

enum class Shape : std::uint8_t { Uuid, Octets, NetworkAddress, Hexadecimal };

struct FoundShape {
  Shape shape;
  std::size_t length;
};

// The identifier that begins at a place in the text: a UUID; six or more pairs of hexadecimal
// digits with separators; an IPv4 or IPv6 address; twelve or more hexadecimal digits, which in text
// other than paths must not be a decimal number that stands alone.
std::optional<FoundShape> shapeAt(std::string_view text, std::size_t place, bool isPath);

// A number in the shape of the original: "00:00:00:00:00:02".
std::string shaped(Shape shape, std::string_view original, std::uint32_t number);

inline bool isDigit(char letter) { return letter >= '0' && letter <= '9'; }
inline bool isLower(char letter) { return letter >= 'a' && letter <= 'z'; }
std::string lower(std::string_view text);
// Between words of the kernel's texts.
bool isSeparator(char letter);

}  // namespace tally
