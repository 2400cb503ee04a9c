// Submission of finished logs.
#pragma once

#include <functional>
#include <string_view>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// The log file that a writer fills.
class LogFile {
 public:
  virtual ~LogFile() = default;
  // False when the bytes could not be written whole; the log is then not submitted.
  virtual bool write(std::string_view bytes) = 0;
  // What was written is not whole: the log is not submitted.
  virtual void abandon(const Error& reason) = 0;
};

class LogSubmission {
 public:
  using Writer = std::function<void(LogFile&)>;
  virtual ~LogSubmission() = default;
  // Creates the log, calls the writer once, and hands the log over whole or not at all. options may
  // be null, reserved must be. True when the log was written.
  virtual bool SMAWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                        const KvDictionary* options, const KvObject* reserved,
                                        const Writer& writer) = 0;
};

}  // namespace tally
