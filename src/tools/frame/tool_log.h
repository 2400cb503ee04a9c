// The system log of the operator's tool.
#pragma once

#include <cstdio>
#include <memory>

#include "platform/system_log.h"

namespace tally::tools {

// Writes errors to the file as lines of tallyctl, each text once. Other levels concern the daily
// job and are dropped. The file is borrowed.
std::shared_ptr<SystemLog> makeToolLog(std::FILE* file);

}  // namespace tally::tools
