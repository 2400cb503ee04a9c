#include "kv/plist_xml_leaf.h"

#include <charconv>
#include <chrono>
#include <cstdint>
#include <limits>

#include "base/number_text.h"
#include "base/text_lines.h"
#include "base/time_text.h"
#include "base/utf8.h"
#include "kv/base64.h"

namespace tally {
namespace {

constexpr std::uint32_t kLastCodePoint = 0x10FFFF;

// All of the text as an unsigned number; no sign, no blank.
template <class T>
std::optional<T> parseUnsigned(std::string_view text, int base) {
  T value{};
  const char* end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, value, base);
  if (error != std::errc() || stopped != end) return std::nullopt;
  return value;
}

bool takePrefix(std::string_view& text, std::string_view prefix) {
  if (!text.starts_with(prefix)) return false;
  text.remove_prefix(prefix.size());
  return true;
}

// What is between '&' and ';'.
bool appendReference(std::string& out, std::string_view name) {
  static constexpr std::pair<std::string_view, char> kPredefined[] = {
      {"amp", '&'}, {"lt", '<'}, {"gt", '>'}, {"quot", '"'}, {"apos", '\''}};
  for (const auto& [entity, character] : kPredefined) {
    if (name == entity) {
      out += character;
      return true;
    }
  }
  if (!takePrefix(name, "#")) return false;
  const int base = takePrefix(name, "x") ? 16 : 10;
  const auto point = parseUnsigned<std::uint32_t>(name, base);
  if (!point || *point == 0 || *point > kLastCodePoint) return false;
  if (*point >= 0xD800 && *point <= 0xDFFF) return false;  // half of a surrogate pair
  appendCharacter(out, *point);
  return true;
}

}  // namespace

std::optional<std::string> unescapeXml(std::string_view text) {
  constexpr std::size_t kLongestReference = 12;  // with leading zeros: "&#x0010FFFF;"
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t special = std::min(text.find_first_of("&\r", i), text.size());
    out.append(text, i, special - i);
    if (special == text.size()) break;
    if (text[special] == '\r') {
      out += '\n';
      i = special + 1;
      if (i < text.size() && text[i] == '\n') ++i;
      continue;
    }
    const std::size_t length = text.substr(special, kLongestReference).find(';');
    if (length == std::string_view::npos) return std::nullopt;
    if (!appendReference(out, text.substr(special + 1, length - 1))) return std::nullopt;
    i = special + length + 1;
  }
  return out;
}

KvRef<KvNumber> integerFromText(std::string_view text) {
  text = trimmed(text);
  const bool negative = takePrefix(text, "-");
  if (!negative) takePrefix(text, "+");
  const int base = takePrefix(text, "0x") || takePrefix(text, "0X") ? 16 : 10;
  const auto magnitude = parseUnsigned<std::uint64_t>(text, base);
  if (!magnitude) return nullptr;
  constexpr auto kLargest = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  if (negative) {
    if (*magnitude > kLargest + 1) return nullptr;
    return KvNumber::int64(static_cast<std::int64_t>(0 - *magnitude));
  }
  if (*magnitude > kLargest) return KvNumber::uint64(*magnitude);
  return KvNumber::int64(static_cast<std::int64_t>(*magnitude));
}

KvRef<KvNumber> realFromText(std::string_view text) {
  text = trimmed(text);
  if (takePrefix(text, "+") && text.starts_with('-')) return nullptr;
  const auto value = parseDouble(text);
  return value ? KvNumber::float64(*value) : nullptr;
}

KvRef<KvDate> dateFromText(std::string_view text) {
  text = trimmed(text);
  constexpr std::string_view pattern = "dddd-dd-ddTdd:dd:ddZ";
  if (text.size() != pattern.size()) return nullptr;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (pattern[i] == 'd' ? text[i] < '0' || text[i] > '9' : text[i] != pattern[i]) return nullptr;
  }
  const auto field = [&](std::size_t at, std::size_t length) {
    return parseUnsigned<unsigned>(text.substr(at, length), 10).value_or(0);
  };
  const std::chrono::year_month_day date{std::chrono::year(static_cast<int>(field(0, 4))),
                                         std::chrono::month(field(5, 2)),
                                         std::chrono::day(field(8, 2))};
  const unsigned hour = field(11, 2), minute = field(14, 2), second = field(17, 2);
  if (!date.ok() || hour > 23 || minute > 59 || second > 59) return nullptr;
  const auto day = static_cast<double>(std::chrono::sys_days(date).time_since_epoch().count());
  return KvDate::create(day * kSecondsPerDay + hour * 3600 + minute * 60 + second);
}

KvRef<KvData> dataFromText(std::string_view text) {
  const auto bytes = decodeBase64(text);
  return bytes ? KvData::create(*bytes) : nullptr;
}

}  // namespace tally
