#include "host/record/shapes.h"

#include <algorithm>

namespace tally {
namespace {

bool isHex(char letter) {
  return isDigit(letter) || (letter >= 'a' && letter <= 'f') || (letter >= 'A' && letter <= 'F');
}

// How many letters from the place on are of a kind.
template <class IsOfKind>
std::size_t run(std::string_view text, std::size_t place, IsOfKind isOfKind) {
  std::size_t length = 0;
  while (place + length < text.size() && isOfKind(text[place + length])) ++length;
  return length;
}

bool endsAt(std::string_view text, std::size_t place) {
  return place >= text.size() || !isHex(text[place]);
}

std::size_t uuidLength(std::string_view text, std::size_t place) {
  constexpr std::string_view kPattern = "hhhhhhhh-hhhh-hhhh-hhhh-hhhhhhhhhhhh";
  if (text.size() - place < kPattern.size()) return 0;
  for (std::size_t i = 0; i < kPattern.size(); ++i) {
    const char letter = text[place + i];
    if (kPattern[i] == 'h' ? !isHex(letter) : letter != '-') return 0;
  }
  return endsAt(text, place + kPattern.size()) ? kPattern.size() : 0;
}

std::size_t octetsLength(std::string_view text, std::size_t place) {
  constexpr std::size_t kFewest = 6;
  if (run(text, place, isHex) != 2 || place + 2 >= text.size()) return 0;
  const char separator = text[place + 2];
  if (separator != ':' && separator != '-' && separator != '_') return 0;
  std::size_t count = 1, end = place + 2;
  while (end < text.size() && text[end] == separator && run(text, end + 1, isHex) == 2) {
    ++count;
    end += 3;
  }
  return count >= kFewest ? end - place : 0;
}

std::size_t ipv6Length(std::string_view text, std::size_t place) {
  const std::size_t length =
      run(text, place, [](char letter) { return isHex(letter) || letter == ':'; });
  const std::string_view token = text.substr(place, length);
  const auto colons = std::ranges::count(token, ':');
  const bool isShort = colons >= 3 && token.find("::") != token.npos;
  return colons >= 6 || isShort ? length : 0;
}

std::size_t ipv4Length(std::string_view text, std::size_t place) {
  std::size_t end = place;
  for (int group = 0; group < 4; ++group) {
    if (group > 0 && (end >= text.size() || text[end++] != '.')) return 0;
    const std::size_t digits = run(text, end, isDigit);
    if (digits == 0 || digits > 3) return 0;
    end += digits;
  }
  return end == text.size() || (text[end] != '.' && !isHex(text[end])) ? end - place : 0;
}

std::size_t hexLength(std::string_view text, std::size_t place, bool isPath) {
  constexpr std::size_t kFewest = 12;
  const std::size_t length = run(text, place, isHex);
  if (length < kFewest) return 0;
  const bool isDecimal = std::ranges::all_of(text.substr(place, length), isDigit);
  const auto standsAlone = [&] {
    const std::size_t before = place > 0 && text[place - 1] == '-' ? place - 1 : place;
    const std::size_t after = place + length;
    return (before == 0 || isSeparator(text[before - 1])) &&
           (after == text.size() || isSeparator(text[after]) || text[after] == '.');
  };
  return !isPath && isDecimal && standsAlone() ? 0 : length;
}

}  // namespace

std::string lower(std::string_view text) {
  std::string result(text);
  for (char& letter : result) {
    if (letter >= 'A' && letter <= 'Z') letter = static_cast<char>(letter - 'A' + 'a');
  }
  return result;
}

bool isSeparator(char letter) {
  return std::string_view(" \t\r\n,;=:()[]{}<>|\"'").find(letter) != std::string_view::npos;
}

std::optional<FoundShape> shapeAt(std::string_view text, std::size_t place, bool isPath) {
  const char letter = text[place];
  const char before = place > 0 ? text[place - 1] : ' ';
  if (isHex(before) || (!isHex(letter) && letter != ':')) return std::nullopt;
  if (const auto length = uuidLength(text, place)) return FoundShape{Shape::Uuid, length};
  if (const auto length = octetsLength(text, place)) return FoundShape{Shape::Octets, length};
  if (before != '.' && before != ':') {
    if (const auto length = ipv6Length(text, place)) {
      return FoundShape{Shape::NetworkAddress, length};
    }
    if (const auto length = ipv4Length(text, place)) {
      return FoundShape{Shape::NetworkAddress, length};
    }
  }
  const auto length = isHex(letter) ? hexLength(text, place, isPath) : 0;
  return length > 0 ? std::optional(FoundShape{Shape::Hexadecimal, length}) : std::nullopt;
}

std::string shaped(Shape shape, std::string_view original, std::uint32_t number) {
  if (shape == Shape::NetworkAddress) {
    if (original.find(':') != original.npos) return "::0:" + std::to_string(number);
    return "0.0." + std::to_string(number >> 8 & 0xFF) + "." + std::to_string(number & 0xFF);
  }
  // The digits of the number are written from the end over zeros.
  std::string text(original);
  for (std::size_t i = text.size(); i > 0; --i) {
    if (!isHex(text[i - 1])) continue;
    text[i - 1] = static_cast<char>('0' + number % 10);
    number /= 10;
  }
  return text;
}

}  // namespace tally
