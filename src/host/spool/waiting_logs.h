// Files that wait on the device for an uploader: submitted logs, structured data, analytics events.
#pragma once

#include <cstdint>
#include <string_view>

#include "base/files/device_root.h"

namespace tally {

// A directory of numbered files, and the lock file of its writers.
struct LogFolder {
  std::string_view path, lock;
  DeviceDirectory on(const DeviceRoot& root) const { return {root, std::string(path)}; }
};
constexpr LogFolder kSubmittedLogs{"/var/mobile/Library/Logs/Submission", ".spool.lock"};
constexpr LogFolder kStructuredDataLogs{"/var/mobile/Library/Logs/StructuredData",
                                        ".structured-data.lock"};
constexpr LogFolder kAnalyticsEventLogs{"/var/mobile/Library/Logs/AnalyticsEvents", ".events.lock"};
// Logs that "tallyctl report take" has moved out of the spool for the hooks. Another user takes
// them from here, so it is not in the home of the program's user. It comes last: a log that is
// being moved while they are erased is erased here.
constexpr LogFolder kOutgoingLogs{"/var/spool/tallyrun", ".outgoing.lock"};
constexpr LogFolder kLogFolders[] = {kSubmittedLogs, kStructuredDataLogs, kAnalyticsEventLogs,
                                     kOutgoingLogs};

// At the end of the name of a file that is held back.
constexpr std::string_view kHeldSuffix = ".held";

struct WaitingFiles {
  std::uint64_t files = 0, bytes = 0;
};
// How much waits in all folders. A folder that cannot be listed is left out.
WaitingFiles countWaiting(const DeviceRoot& root);

enum class WaitingAction {
  Erase,
  Hold,     // renames NAME to NAME.held, which uploaders ignore; the folder's bounds still apply
  Release,  // names them as they were
};
// Applies the action to every waiting file; Erase includes held ones, and the pseudonym under which
// logs were submitted. Returns the number of files,
// or an error if one of them failed, after all others were handled.
Result<std::uint64_t> handleWaiting(const DeviceRoot& root, WaitingAction action);

}  // namespace tally
