// The system log of the operator's tool.
#pragma once

#include <cstdio>
#include <memory>

#include "platform/system_log.h"

namespace tally::tools {

// Errors go to the file as lines of tallyctl, the same one once; everything else is the daily job's
// affair. The file is borrowed.
std::shared_ptr<SystemLog> makeToolLog(std::FILE* file);

}  // namespace tally::tools
