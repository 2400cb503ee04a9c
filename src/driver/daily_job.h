// DailyJob: the entry point, the day check and the sequence of a day's tasks.
#pragma once

#include <cstdint>
#include <functional>
#include <span>

#include "kv/value.h"

namespace tally {

class DailyJob;

// Capabilities that join the daily job from outside. One that is empty is left out: its place in
// the sequence is passed over.
struct DailyCapabilities {
  // Starts the IPC listener of the scheduled mode; false when it cannot be created.
  std::function<bool(DailyJob&)> startListener;
  // Ends the listening, unless a message had arrived: then it is handled, the listening goes on,
  // and the result is true.
  std::function<bool()> stopListener;
  // Records device health values as scalars of the day in progress.
  std::function<void()> runTelemetrySweep;
  // Notices system updates and applies scheduled preference changes.
  std::function<void()> updateTaskingState;
};

class DailyJob {
 public:
  explicit DailyJob(DailyCapabilities capabilities) : capabilities_(std::move(capabilities)) {}

  // The whole run; arguments begin with the program's name. At most one switch is looked at: "-d",
  // "-f" or "-t". Returns the exit status, always 0.
  int run(std::span<const char* const> arguments);

  // Processes yesterday unless it, or a later day, already was; then remembers it. appInfo may be
  // null.
  void runIfNewDay(const KvArray* appInfo);

  // Does the work of a day: always all tasks, always in the same order; no task's result changes
  // what the next does. appInfo may be null.
  void runDaily(std::int32_t day, const KvArray* appInfo);

  // Set when the system announced that app information will be sent, until it was used.
  bool appInfoRequested = false;

 private:
  void runScheduled();
  void waitForQuiet();
  void runSwitch(const char* argument);

  DailyCapabilities capabilities_;
};

}  // namespace tally
