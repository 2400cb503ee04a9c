#include "tools/frame/day_argument.h"

#include <chrono>
#include <limits>

#include "base/number_text.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

std::optional<std::int32_t> parseDate(std::string_view text) {
  constexpr std::size_t kLength = 10;  // YYYY-MM-DD
  if (text.size() != kLength || text[4] != '-' || text[7] != '-') return std::nullopt;
  const auto year = parseInt64(text.substr(0, 4));
  const auto month = parseInt64(text.substr(5, 2));
  const auto day = parseInt64(text.substr(8, 2));
  if (!year || !month || !day || *year < 1 || *month < 1 || *day < 1) return std::nullopt;
  const std::chrono::year_month_day date{std::chrono::year(static_cast<int>(*year)),
                                         std::chrono::month(static_cast<unsigned>(*month)),
                                         std::chrono::day(static_cast<unsigned>(*day))};
  if (!date.ok()) return std::nullopt;
  return static_cast<std::int32_t>(std::chrono::sys_days(date).time_since_epoch().count());
}

}  // namespace

std::optional<std::int32_t> parseDay(std::string_view text, std::int32_t today) {
  if (text == "today") return today;
  if (text == "yesterday") return today - 1;
  if (const auto date = parseDate(text)) return date;
  const auto number = parseInt64(text);
  if (!number || *number < std::numeric_limits<std::int32_t>::min() ||
      *number > std::numeric_limits<std::int32_t>::max()) {
    return std::nullopt;
  }
  return static_cast<std::int32_t>(*number);
}

std::optional<std::int32_t> dayOf(const ToolContext& context, std::string_view text) {
  const auto day = parseDay(text, context.platform->metricsStore->TBDaysSince1970());
  if (!day) complain(context, fmt::format("not a day: {}", text), kBadUsage);
  return day;
}

}  // namespace tally::tools
