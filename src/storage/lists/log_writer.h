// When the storage log may be written again.
#pragma once

#include <optional>

#include "base/time_text.h"

namespace tally {

constexpr double kSecondsBetweenStorageLogs = 7 * kSecondsPerDay;

// When it last submitted a log, in seconds since 1970; empty when it never did.
std::optional<double> lastStorageLog();

}  // namespace tally
