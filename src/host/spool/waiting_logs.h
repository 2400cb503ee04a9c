// What waits on the device to be taken away: submitted logs, structured data and analytics events.
#pragma once

#include <cstdint>
#include <string_view>

#include "base/device_root.h"

namespace tally {

// A directory of numbered files, and the lock of whoever changes it.
struct LogFolder {
  std::string_view path, lock;
  DeviceDirectory on(const DeviceRoot& root) const { return {root, std::string(path)}; }
};
constexpr LogFolder kSubmittedLogs{"/var/mobile/Library/Logs/Submission", ".spool.lock"};
constexpr LogFolder kStructuredDataLogs{"/var/mobile/Library/Logs/StructuredData",
                                        ".structured-data.lock"};
constexpr LogFolder kAnalyticsEventLogs{"/var/mobile/Library/Logs/AnalyticsEvents", ".events.lock"};
constexpr LogFolder kLogFolders[] = {kSubmittedLogs, kStructuredDataLogs, kAnalyticsEventLogs};

struct WaitingFiles {
  std::uint64_t files = 0, bytes = 0;
};
// How much waits in all folders. What cannot be listed counts as nothing.
WaitingFiles countWaiting(const DeviceRoot& root);

enum class WaitingAction {
  Erase,
  Hold,     // renames NAME to NAME.held, which nobody takes away; the folder's bounds still hold
  Release,  // names them as they were
};
// Does so with every file that waits, those held included when they are erased. The number of files
// concerned; an error when one could not be, after all others were.
Result<std::uint64_t> handleWaiting(const DeviceRoot& root, WaitingAction action);

}  // namespace tally
