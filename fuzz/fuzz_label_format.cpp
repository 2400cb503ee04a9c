// Label formats: what is accepted prints as printf would, and never longer than is promised.
#include "storage/snapshot/label_format.h"

#include <array>
#include <cstdio>
#include <string>

#include "fuzz.h"

using namespace tally;
using fuzz::require;

namespace {

using Text = std::array<char, LabelFormat::kLongestText>;

// Of a format that was accepted: it holds one conversion at most, of an int.
std::string printed(const std::string& format, std::uint32_t value) {
  char text[512];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
  const int length = std::snprintf(text, sizeof text, format.c_str(), value);
#pragma GCC diagnostic pop
  return {text, static_cast<std::size_t>(length)};
}

}  // namespace

FUZZ_TARGET(label_format)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto value = input.take<std::uint32_t>();
  const std::string format(input.takeText(LabelFormat::kLongestFormat));
  Text text;
  if (const auto label = LabelFormat::parse(format, LabelArgument::Number)) {
    const std::string made(text.data(), label->appendNumber(text.data(), value));
    // Fields have 32 bits, so that what longer types would print is not theirs.
    if (format.find('\0') == format.npos && format.find_first_of("ljzt") == format.npos) {
      require(made == printed(format, value), "a number prints as printf prints it");
    }
  }
  if (const auto label = LabelFormat::parse(format, LabelArgument::Letter)) {
    label->appendLetter(text.data(), 'O');
  }
  return 0;
}
