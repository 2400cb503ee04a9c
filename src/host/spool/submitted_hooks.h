// Programs of the administrator that take submitted logs away.
#pragma once

#include <chrono>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "host/spool/log_spool.h"

namespace tally {

constexpr std::string_view kHooksFolder = "/etc/tallyrun.d/submitted";

struct Hook {
  std::string name;
  Descriptor program;
};
// The hooks of the device, in the order of their names: the executable files there that are named
// with letters, digits, "-" and "_". Each, and every directory down to it, must belong to root, and
// nobody else may be able to write it; else none is returned, and the error says which. What is
// checked is the open file that is executed later. Links are not followed.
Result<std::vector<Hook>> openHooks(const DeviceRoot& root);

struct HookRun {
  std::uint64_t done = 0;           // logs that every hook has taken, which are removed
  std::uint64_t waiting = 0;        // that stay for the next time
  std::vector<std::string> faults;  // why
};

// Runs every hook for each log of the outgoing folder, oldest first, with the log's path and that
// of its information as arguments, and no longer than the limit. A log is removed once all hooks
// have ended with the status 0. consent is asked before each hook; without it nothing more is run.
// Only one such call works at a time. REQUIRES: the program does not run as root.
Result<HookRun> runHooks(const DeviceRoot& root, const std::vector<Hook>& hooks,
                         std::chrono::seconds limit, const std::function<bool()>& consent);

}  // namespace tally
