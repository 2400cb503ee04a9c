// Crash-reporting services.
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

// The crash-reporting support library, which a product may ship without. It is opened on first use;
// its entry points reach the preferences.
class CrashSupportLibrary {
 public:
  virtual ~CrashSupportLibrary() = default;
  // False when there is no such library. May be called again.
  virtual bool open() = 0;
  // True when the opened library has the entry point of this name.
  virtual bool hasSymbol(const char* name) = 0;
};

}  // namespace tally
