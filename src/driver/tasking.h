// Tasking: preferences that the system schedules for this device.
#pragma once

#include "driver/tasking_plan.h"
#include "platform/platform.h"

namespace tally {

// As they read now, with the schedule of the system configuration.
TaskingInputs readTaskingInputs(Platform& platform);

// Does what a plan says, in its order, and posts the notification when something has changed. Each
// preference that could not be written is logged and left to the next run, and no tasking counts as
// in force before all of them are. False when something is left, or nothing could be recorded.
bool carryOut(Platform& platform, const TaskingPlan& plan);

// Both, as a step of the day's sequence.
void updateTaskingState(Platform& platform);

}  // namespace tally
