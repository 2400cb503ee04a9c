// A variant of the platform in which a run of the daily job's steps leaves no trace.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/platform.h"

namespace tally::tools {

// What the steps would have written.
struct DryRun {
  struct Log {
    std::string typeCode, name, body;
    KvRef<KvDictionary> options;  // null when there are none
  };
  std::vector<Log> logs;
  std::size_t records = 0;  // of structured data

  // A variant of a platform whose preferences forget what is written to them, and whose log
  // submission and structured-data log are kept here. The run outlives the variant.
  Platform variantOf(const Platform& platform);
};

}  // namespace tally::tools
