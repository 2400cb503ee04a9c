// The crash-reporting service.
#pragma once

#include <cstdint>

#include "kv/value.h"

namespace tally {

class CrashReporting {
 public:
  virtual ~CrashReporting() = default;
  // True when the user allows diagnostic logs to be submitted.
  virtual bool isDiagnosticSubmissionEnabled() = 0;
  // Appends a record to the pending structured-data log of its type. A failure is logged.
  virtual void FDLogStructuredData(std::uint32_t recordType, const KvDictionary& record) = 0;
  // Writes out the structured-data logs that are still pending.
  virtual void FDDumpAllOldStructuredDataLogs() = 0;
  // Rotates the repair-service logs.
  virtual void rollFixlineLogs() = 0;
};

}  // namespace tally
