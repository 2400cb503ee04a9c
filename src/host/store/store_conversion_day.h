// When a store of the former format is converted.
#pragma once

#include <cstdint>

#include "platform/preferences.h"

namespace tally {

// Whether a checkpoint on that day is to convert the store, and counts the day. Without a
// preference this takes 30 days on which this program made a checkpoint: a system that is rolled
// back earlier finds its store as it was. Nothing but such a day counts, for a clock can jump over
// any number of days. The count is kept in the program's own preferences and reaches the flash with
// what else is written there on that day. It starts again once another version of the program,
// which knows nothing of it, has processed a day in between. Call it before the day is recorded as
// processed, and only while the store is of the former format.
bool conversionIsDue(Preferences& preferences, std::int32_t today);

// Forgets the count once the store is converted.
void endConversion(Preferences& preferences);

}  // namespace tally
