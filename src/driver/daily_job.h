// The daily job: its run modes.
#pragma once

#include <span>

#include "driver/daily_tasks.h"
#include "platform/platform.h"

namespace tally {

// The whole run; arguments begin with the program's name. At most one switch is read: "-d", "-f" or
// "-t"; without one, the job is scheduled and listens for messages. Returns the exit status, always
// 0.
int runDailyJob(Platform& platform, std::span<const char* const> arguments,
                ReplaceableTasks tasks = {});

}  // namespace tally
