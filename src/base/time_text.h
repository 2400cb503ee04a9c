// Days and instants as text (UTC).
#pragma once

#include <cstdint>
#include <string>

namespace tally {

constexpr std::int64_t kSecondsPerDay = 86400;

// Whole days since 1970-01-01 of an instant; days before it are negative.
std::int32_t dayOfSeconds(double secondsSince1970);
// "2026-03-01T12:30:00Z", whole seconds, rounded down. Instants outside the years 1 to 9999 are
// shown at the nearer end.
void appendTimestamp(std::string& out, double secondsSince1970);
// "2026-03-01 12:30:00 +0000", likewise.
std::string dateAndTimeText(double secondsSince1970);
// "2026-03-01".
std::string dayText(std::int32_t day);

}  // namespace tally
