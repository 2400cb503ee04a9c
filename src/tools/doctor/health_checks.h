// The checks of `tallyctl doctor`.
#pragma once

#include <string>
#include <vector>

#include "tools/frame/tool.h"

namespace tally::tools {

enum class Health {
  Ok,
  Missing,  // not there; the program does without
  Wrong,    // there, and not as it should be
};

struct HealthLine {
  Health health;
  std::string subject, text;
  std::string repair = {};  // a command line for a shell; empty: none is known
};

// Every check, in the order in which a day's run meets what they look at. Nothing is changed.
std::vector<HealthLine> examineDevice(const ToolContext& context);

// Those of the files below the root, of the services, and of the drivers.
void examineFiles(const ToolContext& context, std::vector<HealthLine>& lines);
void examineServices(const ToolContext& context, std::vector<HealthLine>& lines);
void examineDrivers(std::vector<HealthLine>& lines);

}  // namespace tally::tools
