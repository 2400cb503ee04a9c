// The tasks of a day, and the check that each day is processed once.
#pragma once

#include <cstdint>

#include "driver/tasking.h"
#include "driver/telemetry_sweep.h"
#include "kv/value.h"
#include "platform/platform.h"

namespace tally {

// Tasks that a test replaces, to see when they run.
struct ReplaceableTasks {
  void (*runTelemetrySweep)(Platform&) = tally::runTelemetrySweep;
  void (*updateTaskingState)(Platform&) = tally::updateTaskingState;
};

class DailyTasks {
 public:
  // The platform must outlive this object.
  explicit DailyTasks(Platform& platform, ReplaceableTasks tasks = {})
      : platform_(platform), tasks_(tasks) {}

  // Processes yesterday unless it, or a later day, already was; then remembers it. appInfo may be
  // null.
  void runIfNewDay(const KvArray* appInfo);

  // Always runs all tasks, always in the same order; the result of one does not change what the
  // next does. appInfo may be null.
  void runDaily(std::int32_t day, const KvArray* appInfo);

 private:
  Platform& platform_;
  const ReplaceableTasks tasks_;
};

}  // namespace tally
