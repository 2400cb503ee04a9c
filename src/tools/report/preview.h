// The log that would be submitted, made without leaving a trace.
#pragma once

#include <cstdint>
#include <string>

#include "kv/value.h"
#include "platform/platform.h"
#include "report/log_values.h"

namespace tally::tools {

struct Preview {
  KvRef<KvDictionary> document;  // null when no log would be submitted
  KvRef<KvDictionary> options;   // of the submission; null when there are none
  std::string body;              // the document as its bytes
};

// Builds the day's log with the steps of the daily job, as a dry run. Follows a key if a trace is
// given.
Preview previewLog(const Platform& platform, std::int32_t day, KeyTrace* trace = nullptr);

}  // namespace tally::tools
