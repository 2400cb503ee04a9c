// Numbers as text and back, the same on every machine and in every locale.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tally {

void appendInt64(std::string& out, std::int64_t value);
void appendUInt64(std::string& out, std::uint64_t value);
// Shortest digits that read back equal: "2.5", "10", "inf", "-inf", "nan"; with an exponent only
// below 1e-4 and from 1e16 on: "100000", "1e+22".
void appendDouble(std::string& out, double value);
// The same for a single, whose shortest digits are not those of the double of equal value; with an
// exponent from 1e7 on.
void appendFloat(std::string& out, float value);

// The whole text as a number, or nothing: no blanks, no sign but a leading '-', no overflow.
std::optional<std::int64_t> parseInt64(std::string_view text);
// Also "inf", "-inf" and "nan".
std::optional<double> parseDouble(std::string_view text);

}  // namespace tally
