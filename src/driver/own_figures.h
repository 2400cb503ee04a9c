// What the job records of the device's time and of itself, for the day's log.
#pragma once

#include "platform/platform.h"
#include "platform/tables/own_metrics.h"

namespace tally {

// At the end of a day's run: the amounts since the run of the day before and the cost of this run
// become scalars of today, and counting goes on until the next one. Nothing is read or written for
// figures that are not wanted.
void recordOwnFigures(Platform& platform, const OwnMetrics& wanted);

// Counts what can be observed at this moment, for what the last run wanted; in the caller's batch.
void keepOwnFigures(Platform& platform);

}  // namespace tally
