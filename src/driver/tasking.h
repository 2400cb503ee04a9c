// Tasking: preferences that the system schedules for this device.
#pragma once

#include "driver/tasking_plan.h"

namespace tally {

// As they read now, with the schedule of the system configuration.
TaskingInputs readTaskingInputs();

// Does what a plan says, in its order, and posts the notification when something has changed. Each
// preference that could not be written is logged and left to the next run, and no tasking counts as
// in force before all of them are. False when something is left, or nothing could be recorded.
bool carryOut(const TaskingPlan& plan);

// Both, as a step of the day's sequence.
void updateTaskingState();

}  // namespace tally
