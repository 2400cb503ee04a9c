// Days as arguments.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace tally::tools {

constexpr const char* kDayForms = "A day: days since 1970-01-01, YYYY-MM-DD, yesterday or today";

// Empty when the text is no day in one of these forms.
std::optional<std::int32_t> parseDay(std::string_view text, std::int32_t today);

}  // namespace tally::tools
