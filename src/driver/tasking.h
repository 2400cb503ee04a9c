// Tasking: preferences that the system schedules for this device.
#pragma once

#include "driver/tasking_plan.h"
#include "platform/platform.h"

namespace tally {

// Reads the record from the preferences and the schedule from the system configuration.
TaskingInputs readTaskingInputs(Platform& platform);

// Carries out a plan in its order, and posts the notification if something has changed. Each
// preference that could not be written is logged and retried by the next run; no tasking is in
// force before all are written. False if something remains to be done, or nothing could be
// recorded.
bool carryOut(Platform& platform, const TaskingPlan& plan);

// Both, as a step of the day's sequence.
void updateTaskingState(Platform& platform);

}  // namespace tally
