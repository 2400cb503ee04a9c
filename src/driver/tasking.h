// Tasking: preferences that the system schedules for this device.
#pragma once

#include "driver/tasking_plan.h"

namespace tally {

// As they read now, with the schedule of the system configuration.
TaskingInputs readTaskingInputs();

// Does what a plan says, in its order, and posts the notification. A write that fails costs a log
// line of the store that refused it; the others are done all the same.
void carryOut(const TaskingPlan& plan);

// Both, as a step of the day's sequence.
void updateTaskingState();

}  // namespace tally
