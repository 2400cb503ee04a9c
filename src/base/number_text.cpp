#include "base/number_text.h"

#include <charconv>
#include <cmath>

namespace tally {
namespace {

template <class T>
void append(std::string& out, T value) {
  char text[32];
  const auto end = std::to_chars(text, text + sizeof text, value).ptr;
  out.append(text, end);
}

template <class T>
void appendReal(std::string& out, T value) {
  if (std::isnan(value)) {
    out += "nan";  // without the sign that some processors give it
  } else {
    append(out, value);
  }
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
