// The system log.
#pragma once

#include <string_view>

namespace tally {

enum class LogLevel { Debug, Info, Default, Error };  // rising importance

class SystemLog {
 public:
  virtual ~SystemLog() = default;
  // False when a message of this level would go nowhere, so that its text need not be made.
  virtual bool enabled(LogLevel level) const = 0;
  // One message, without a newline at its end.
  virtual void write(LogLevel level, std::string_view message) = 0;
};

}  // namespace tally
