#include "base/time_text.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <limits>

namespace tally {
namespace {

using std::chrono::sys_days;

constexpr double kFirstSecond = -62135596800.0;  // 0001-01-01T00:00:00Z
constexpr double kLastSecond = 253402300799.0;   // 9999-12-31T23:59:59Z

std::chrono::year_month_day dateOf(std::int64_t day) {
  return std::chrono::year_month_day(sys_days(std::chrono::days(static_cast<int>(day))));
}

}  // namespace

std::int32_t dayOfSeconds(double secondsSince1970) {
  if (std::isnan(secondsSince1970)) return 0;
  const double day = std::floor(secondsSince1970 / kSecondsPerDay);
  return static_cast<std::int32_t>(std::clamp(day, double{std::numeric_limits<std::int32_t>::min()},
                                              double{std::numeric_limits<std::int32_t>::max()}));
}

void appendTimestamp(std::string& out, double secondsSince1970) {
  const double bounded = std::isnan(secondsSince1970)
                             ? 0
                             : std::clamp(std::floor(secondsSince1970), kFirstSecond, kLastSecond);
  const auto seconds = static_cast<std::int64_t>(bounded);
  const std::int32_t day = dayOfSeconds(bounded);
  const auto rest = static_cast<int>(seconds - std::int64_t{day} * kSecondsPerDay);
  const auto date = dateOf(day);
  char text[40];
  const int length =
      std::snprintf(text, sizeof text, "%04d-%02u-%02uT%02d:%02d:%02dZ",
                    static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                    static_cast<unsigned>(date.day()), rest / 3600, rest / 60 % 60, rest % 60);
  out.append(text, static_cast<std::size_t>(length));
}

std::string dateAndTimeText(double secondsSince1970) {
  std::string text;
  appendTimestamp(text, secondsSince1970);
  text[text.find('T')] = ' ';
  text.pop_back();
  return text + " +0000";
}

std::string dayText(std::int32_t day) {
  std::string text;
  appendTimestamp(text, static_cast<double>(kSecondsPerDay * day));
  return text.substr(0, text.find('T'));
}

}  // namespace tally
