#include "base/number_text.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <type_traits>

namespace tally {
namespace {

template <class T, class... Format>
void append(std::string& out, T value, Format... format) {
  char text[32];
  const auto end = std::to_chars(text, text + sizeof text, value, format...).ptr;
  out.append(text, end);
}

template <class T>
void appendReal(std::string& out, T value) {
  if (std::isnan(value)) {
    out += "nan";  // without the sign that some processors give it
    return;
  }
  // Plain digits as far as the type's precision reaches, so that 100000 does not become "1e+05"
  // beside 250000.
  constexpr T kPlainFrom = T(1e-4);
  constexpr T kPlainBelow = std::is_same_v<T, float> ? T(1e7) : T(1e16);
  const T size = std::fabs(value);
  // Whole numbers are frequent, and their digits several times faster as an integer's.
  constexpr T kExactBelow = T(std::uint64_t{1} << std::numeric_limits<T>::digits);
  if (size < std::min(kExactBelow, kPlainBelow) && size == std::trunc(size) && size != 0) {
    append(out, static_cast<std::int64_t>(value));
    return;
  }
  const bool plain = size == 0 || (size >= kPlainFrom && size < kPlainBelow);
  append(out, value, plain ? std::chars_format::fixed : std::chars_format::scientific);
}

template <class T>
std::optional<T> parse(std::string_view text) {
  T value{};
  const char* end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, value);
  if (error != std::errc() || stopped != end) return std::nullopt;
  return value;
}

}  // namespace

void appendInt64(std::string& out, std::int64_t value) { append(out, value); }
void appendUInt64(std::string& out, std::uint64_t value) { append(out, value); }

void appendDouble(std::string& out, double value) { appendReal(out, value); }
void appendFloat(std::string& out, float value) { appendReal(out, value); }

std::optional<std::int64_t> parseInt64(std::string_view text) { return parse<std::int64_t>(text); }
std::optional<double> parseDouble(std::string_view text) { return parse<double>(text); }

}  // namespace tally
