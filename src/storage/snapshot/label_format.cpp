#include "storage/snapshot/label_format.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstring>

namespace tally {
namespace {

constexpr std::size_t kMostDigits = 11;  // of 32 bits in octal

bool take(std::string_view& rest, std::string_view text) {
  if (!rest.starts_with(text)) return false;
  rest.remove_prefix(text.size());
  return true;
}

// A decimal number, 0 when there are no digits; empty when it is too large.
std::optional<std::uint8_t> takeNumber(std::string_view& rest) {
  std::size_t number = 0;
  for (; !rest.empty() && rest[0] >= '0' && rest[0] <= '9'; rest.remove_prefix(1)) {
    number = number * 10 + static_cast<std::size_t>(rest[0] - '0');
    if (number > LabelFormat::kLongestWidth) return std::nullopt;
  }
  return static_cast<std::uint8_t>(number);
}

// Up to the next conversion; empty when a percent sign ends the format.
std::optional<std::string_view> takeText(std::string_view& rest) {
  std::size_t length = 0;
  while (length < rest.size()) {
    if (rest[length] != '%') {
      ++length;
    } else if (length + 1 == rest.size()) {
      return std::nullopt;
    } else if (rest[length + 1] == '%') {
      length += 2;
    } else {
      break;
    }
  }
  const std::string_view text = rest.substr(0, length);
  rest.remove_prefix(length);
  return text;
}

char* appendBytes(char* to, std::string_view bytes) {
  return std::copy(bytes.begin(), bytes.end(), to);
}

char* appendFill(char* to, std::size_t count, char fill) {
  std::memset(to, fill, count);
  return to + count;
}

char* appendUnescaped(char* to, std::string_view text) {
  for (std::size_t i = 0; i < text.size(); ++i) {
    *to++ = text[i];
    if (text[i] == '%') ++i;
  }
  return to;
}

}  // namespace

std::optional<LabelFormat> LabelFormat::parse(std::string_view format, LabelArgument argument) {
  LabelFormat label;
  std::string_view rest = format;
  const auto before = takeText(rest);
  if (!before) return std::nullopt;
  label.before_ = *before;
  if (rest.empty()) return label;
  if (!label.parseConversion(rest, argument)) return std::nullopt;
  const auto after = takeText(rest);
  if (!after || !rest.empty()) return std::nullopt;  // a second conversion
  label.after_ = *after;
  return label;
}

// REQUIRES: the rest begins with a percent sign.
bool LabelFormat::parseConversion(std::string_view& rest, LabelArgument argument) {
  rest.remove_prefix(1);
  for (bool more = true; more;) {
    if (take(rest, "-")) {
      left_ = true;
    } else if (take(rest, "0")) {
      zero_ = true;
    } else if (take(rest, "+")) {
      plus_ = true;
    } else if (take(rest, " ")) {
      space_ = true;
    } else if (take(rest, "#")) {
      alternate_ = true;
    } else {
      more = false;
    }
  }
  const auto width = takeNumber(rest);
  if (!width) return false;
  width_ = *width;
  if (take(rest, ".")) {
    precision_ = takeNumber(rest);
    if (!precision_) return false;
  }
  if (argument == LabelArgument::Number) {
    // Fields have 32 bits, so that the longer types change nothing.
    if (take(rest, "hh")) {
      mask_ = 0xFF;
    } else if (take(rest, "h")) {
      mask_ = 0xFFFF;
    } else {
      (void)(take(rest, "ll") || take(rest, "l") || take(rest, "j") || take(rest, "z") ||
             take(rest, "t"));
    }
  }
  const std::string_view allowed = argument == LabelArgument::Number ? "diuoxX" : "cs";
  if (rest.empty() || allowed.find(rest[0]) == std::string_view::npos) return false;
  conversion_ = rest[0];
  rest.remove_prefix(1);
  return true;
}

char* LabelFormat::appendPadded(char* to, std::string_view prefix, std::size_t zeros,
                                std::string_view body) const {
  const std::size_t length = prefix.size() + zeros + body.size();
  const std::size_t fill = width_ > length ? width_ - length : 0;
  if (!left_) to = appendFill(to, fill, ' ');
  to = appendBytes(to, prefix);
  to = appendFill(to, zeros, '0');
  to = appendBytes(to, body);
  if (left_) to = appendFill(to, fill, ' ');
  return to;
}

char* LabelFormat::appendNumber(char* to, std::uint32_t value) const {
  to = appendUnescaped(to, before_);
  if (conversion_ == '\0') return to;
  const bool isSigned = conversion_ == 'd' || conversion_ == 'i';
  value &= mask_;
  const bool negative = isSigned && (value & (mask_ / 2 + 1)) != 0;
  const std::uint32_t magnitude = negative ? (0u - value) & mask_ : value;

  std::array<char, kMostDigits> digits;
  std::size_t count = 0;
  if (magnitude != 0 || precision_ != std::uint8_t{0}) {
    const int base = conversion_ == 'o' ? 8 : conversion_ == 'x' || conversion_ == 'X' ? 16 : 10;
    char* const end =
        std::to_chars(digits.data(), digits.data() + digits.size(), magnitude, base).ptr;
    count = static_cast<std::size_t>(end - digits.data());
    if (conversion_ == 'X') {
      for (char* c = digits.data(); c != end; ++c) {
        if (*c >= 'a') *c = static_cast<char>(*c - 'a' + 'A');
      }
    }
  }
  std::string_view prefix;
  if (negative) {
    prefix = "-";
  } else if (isSigned && (plus_ || space_)) {
    prefix = plus_ ? "+" : " ";
  } else if (alternate_ && magnitude != 0 && conversion_ == 'x') {
    prefix = "0x";
  } else if (alternate_ && magnitude != 0 && conversion_ == 'X') {
    prefix = "0X";
  }
  std::size_t least = precision_.value_or(1);
  if (alternate_ && conversion_ == 'o' && least <= count && (magnitude != 0 || count == 0)) {
    least = count + 1;  // octal shows its leading zero as a digit
  }
  if (zero_ && !left_ && !precision_) {
    least = std::max(least, width_ > prefix.size() ? width_ - prefix.size() : 0);
  }
  to = appendPadded(to, prefix, least > count ? least - count : 0, {digits.data(), count});
  return appendUnescaped(to, after_);
}

char* LabelFormat::appendLetter(char* to, char letter) const {
  to = appendUnescaped(to, before_);
  if (conversion_ == '\0') return to;
  const bool cut = conversion_ == 's' && precision_ == std::uint8_t{0};
  to = appendPadded(to, {}, 0, {&letter, cut ? 0u : 1u});
  return appendUnescaped(to, after_);
}

}  // namespace tally
