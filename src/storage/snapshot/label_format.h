// Label formats from a device's buffer. They are parsed here and printed by our own code, never by
// printf: the writer of the buffer must not choose what is read from the stack.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace tally {

// What the conversion prints.
enum class LabelArgument { Number, Letter };

// A supported label format: a text with at most one conversion. For a number that is
// d, i, u, o, x or X, with flags, width and precision; for a letter c or s. "%%" is a percent sign.
class LabelFormat {
 public:
  // The longest text of a label, in bytes.
  static constexpr std::size_t kLongestWidth = 99;
  static constexpr std::size_t kLongestFormat = 16;
  static constexpr std::size_t kLongestText = kLongestFormat + kLongestWidth + 3;

  LabelFormat() = default;
  // Empty when the format contains more than one conversion, one that is not of the argument's
  // kind, one that ends early, or a width or precision above kLongestWidth or given by an argument.
  // The format is borrowed. REQUIRES: at most kLongestFormat bytes.
  static std::optional<LabelFormat> parse(std::string_view format, LabelArgument argument);

  bool empty() const noexcept { return before_.empty() && conversion_ == '\0'; }
  // Write the label at `to` and return its end. REQUIRES: space for kLongestText bytes.
  char* appendNumber(char* to, std::uint32_t value) const;
  char* appendLetter(char* to, char letter) const;

 private:
  bool parseConversion(std::string_view& rest, LabelArgument argument);
  char* appendPadded(char* to, std::string_view prefix, std::size_t zeros,
                     std::string_view body) const;

  std::string_view before_, after_;  // "%%" is still double in both
  char conversion_ = '\0';           // none
  bool left_ = false, zero_ = false, plus_ = false, space_ = false, alternate_ = false;
  std::uint8_t width_ = 0;
  std::optional<std::uint8_t> precision_;
  std::uint32_t mask_ = 0xFFFFFFFF;  // of the bits that the length modifier leaves
};

}  // namespace tally
