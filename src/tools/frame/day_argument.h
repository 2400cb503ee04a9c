// Days as arguments.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "tools/frame/tool.h"

namespace tally::tools {

constexpr const char* kDayForms = "A day: days since 1970-01-01, YYYY-MM-DD, yesterday or today";

// Empty when the text is not a day in one of these forms.
std::optional<std::int32_t> parseDay(std::string_view text, std::int32_t today);
// The same, relative to the day of the device's clock. Complains when the text is not a day.
std::optional<std::int32_t> dayOf(const ToolContext& context, std::string_view text);

}  // namespace tally::tools
