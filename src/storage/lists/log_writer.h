// When the storage log may be written again.
#pragma once

#include <optional>

namespace tally {

constexpr double kSecondsBetweenStorageLogs = 604800;  // seven days

// When it last submitted a log, in seconds since 1970; empty when it never did.
std::optional<double> lastStorageLog();

}  // namespace tally
