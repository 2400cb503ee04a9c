#include "tools/privacy/key_identifiers.h"

#include <algorithm>
#include <cstddef>

#include "base/number_text.h"
#include "base/text_lines.h"

namespace tally::tools {
namespace {

bool isDecimal(char c) { return c >= '0' && c <= '9'; }
bool isHex(char c) { return isDecimal(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F'); }
bool isLetter(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }

std::string lowerCase(std::string_view text) {
  std::string lower(text);
  for (char& c : lower) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return lower;
}

// How many characters at the beginning are of a kind, at most so many.
template <class IsOfKind>
std::size_t runOf(std::string_view text, IsOfKind isOfKind, std::size_t most = std::string::npos) {
  std::size_t length = 0;
  while (length < text.size() && length < most && isOfKind(text[length])) ++length;
  return length;
}

// Groups of hexadecimal digits of these lengths with a separator between; 0 if the text does not
// begin with them, or goes on with a digit.
std::size_t hexGroups(std::string_view text, std::initializer_list<std::size_t> lengths,
                      std::string_view separators) {
  std::size_t at = 0;
  char separator = 0;
  for (const std::size_t length : lengths) {
    if (at > 0) {
      if (at >= text.size() || separators.find(text[at]) == std::string_view::npos) return 0;
      if (separator != 0 && text[at] != separator) return 0;
      separator = text[at++];
    }
    if (runOf(text.substr(at), isHex, length + 1) != length) return 0;
    at += length;
  }
  return at;
}

std::size_t uuidAt(std::string_view text) { return hexGroups(text, {8, 4, 4, 4, 12}, "-_"); }

std::size_t hardwareAddressAt(std::string_view text) {
  return hexGroups(text, {2, 2, 2, 2, 2, 2}, ":-_");
}

std::size_t internetAddressAt(std::string_view text) {
  constexpr int kParts = 4;
  constexpr std::size_t kDigits = 3;
  for (const char separator : {'.', '_', '-'}) {
    std::size_t at = 0;
    int parts = 0;
    for (; parts < kParts; ++parts) {
      if (parts > 0 && (at >= text.size() || text[at++] != separator)) break;
      const std::size_t digits = runOf(text.substr(at), isDecimal, kDigits + 1);
      const auto number = parseInt64(text.substr(at, digits));
      if (digits == 0 || digits > kDigits || !number || *number > UINT8_MAX) break;
      at += digits;
    }
    if (parts == kParts) return at;
  }
  return 0;
}

// At least four groups between colons, or two and a gap.
std::size_t internetAddress6At(std::string_view text) {
  const std::size_t length = runOf(text, [](char c) { return isHex(c) || c == ':'; });
  const std::string_view address = text.substr(0, length);
  const auto colons = std::ranges::count(address, ':');
  const bool hasGap = address.find("::") != std::string_view::npos;
  return colons >= 3 || (hasGap && colons >= 2 && length > 3) ? length : 0;
}

// Serial numbers: a run of digits, or of hexadecimal digits, that is longer than counts and years
// are; or capital letters and digits mixed.
std::size_t serialAt(std::string_view text) {
  constexpr std::size_t kDecimal = 8, kHex = 12, kMixed = 8;
  const std::size_t length = runOf(text, [](char c) { return isDecimal(c) || isLetter(c); });
  const std::string_view word = text.substr(0, length);
  const auto digits = static_cast<std::size_t>(std::ranges::count_if(word, isDecimal));
  const bool hex = runOf(word, isHex) == length;
  const bool capital = std::ranges::none_of(word, [](char c) { return c >= 'a' && c <= 'z'; });
  if (digits == length && length >= kDecimal) return length;
  if (hex && length >= kHex && digits >= 2) return length;
  return capital && length >= kMixed && digits >= 3 && digits < length ? length : 0;
}

// The names that Linux and systemd give network interfaces: a kind, and where it is.
std::size_t interfaceAt(std::string_view text) {
  constexpr std::string_view kNumbered[] = {"wwan", "wlan", "eth", "usb",  "ppp", "tun",
                                            "tap",  "wg",   "br-", "bond", "can", "veth"};
  constexpr std::string_view kKinds[] = {"en", "wl", "ww", "ib", "sl"};
  const std::size_t length =
      runOf(text, [](char c) { return isDecimal(c) || (c >= 'a' && c <= 'z') || c == '-'; });
  const std::string_view word = text.substr(0, length);
  for (const std::string_view name : kNumbered) {
    if (!word.starts_with(name)) continue;
    const std::string_view rest = word.substr(name.size());
    const bool random = name == "br-" || name == "veth";  // followed by hexadecimal digits
    if (random ? rest.size() >= 7 && runOf(rest, isHex) == rest.size()
               : !rest.empty() && rest.size() <= 3 && runOf(rest, isDecimal) == rest.size()) {
      return length;
    }
  }
  for (const std::string_view kind : kKinds) {
    if (!word.starts_with(kind)) continue;
    // o1, s3, p3s0, p3s0f1, P2p3s0, x001122334455
    std::string_view rest = word.substr(kind.size());
    if (rest.starts_with('x') && rest.size() == 13 && runOf(rest.substr(1), isHex) == 12) {
      return length;
    }
    std::size_t places = 0;
    constexpr std::string_view kPlaces = "opsfdinu";
    while (rest.size() >= 2 && kPlaces.find(rest.front()) != std::string_view::npos &&
           isDecimal(rest[1])) {
      rest.remove_prefix(1);
      rest.remove_prefix(runOf(rest, isDecimal));
      ++places;
    }
    if (places > 0 && rest.empty()) return length;
  }
  return 0;
}

struct Pattern {
  std::string_view kind;
  std::size_t (*at)(std::string_view text);  // how long it is, at the beginning; 0: it is not there
};
constexpr Pattern kPatterns[] = {
    {"a UUID", uuidAt},
    {"a hardware address", hardwareAddressAt},
    {"an IP address", internetAddressAt},
    {"an IP address", internetAddress6At},
    {"a network interface", interfaceAt},
    {"a serial number", serialAt},
};

bool isSeparator(char c) {
  return !isDecimal(c) && !isLetter(c) && static_cast<unsigned char>(c) < 0x80;
}

// Removes the text up to the next colon, and returns it.
std::string_view takeField(std::string_view& line) {
  const std::string_view field = line.substr(0, line.find(':'));
  line.remove_prefix(std::min(line.size(), field.size() + 1));
  return field;
}

bool isPart(std::string_view rest, const std::string& name) {
  return !name.empty() && rest.size() >= name.size() &&
         lowerCase(rest.substr(0, name.size())) == name &&
         (rest.size() == name.size() || isSeparator(rest[name.size()]));
}

}  // namespace

DeviceNames deviceNames(Files& files) {
  constexpr std::size_t kLimit = 1 << 20, kShortest = 3;
  constexpr std::int64_t kFirstPerson = 1000, kLastPerson = 60000;
  DeviceNames names;
  const auto host = files.readFile("/etc/hostname", kLimit);
  if (host) names.host = lowerCase(host->substr(0, host->find_first_of(".\n \t")));
  if (names.host.size() < kShortest || names.host == "localhost") names.host.clear();
  const auto users = files.readFile("/etc/passwd", kLimit);
  eachLine(users ? std::string_view(*users) : std::string_view(), [&](std::string_view line) {
    // NAME:PASSWORD:NUMBER:...
    const std::string_view name = takeField(line);
    takeField(line);
    const auto number = parseInt64(takeField(line));
    if (number && *number >= kFirstPerson && *number <= kLastPerson && name.size() >= kShortest) {
      names.users.push_back(lowerCase(name));
    }
  });
  return names;
}

std::optional<KeyIdentifier> identifierIn(std::string_view key, const DeviceNames& names) {
  for (std::size_t i = 0; i < key.size(); ++i) {
    if (isSeparator(key[i])) continue;
    if (i > 0 && !isSeparator(key[i - 1])) continue;
    const std::string_view rest = key.substr(i);
    for (const auto& [kind, at] : kPatterns) {
      const std::size_t length = at(rest);
      // What goes on is another word.
      if (length == 0 || (length < rest.size() && !isSeparator(rest[length]))) continue;
      return KeyIdentifier{kind, rest.substr(0, length)};
    }
    for (const std::string& user : names.users) {
      if (isPart(rest, user)) return KeyIdentifier{"a user's name", rest.substr(0, user.size())};
    }
    if (isPart(rest, names.host)) {
      return KeyIdentifier{"the host's name", rest.substr(0, names.host.size())};
    }
  }
  return std::nullopt;
}

}  // namespace tally::tools
