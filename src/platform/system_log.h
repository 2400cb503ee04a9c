// The system log.
#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>

#include <fmt/core.h>

#include "base/result.h"

namespace tally {

enum class LogLevel { Debug, Info, Default, Error };  // rising importance

// What may be logged more than once in a run goes through fault() or bounded(): damaged input and a
// full disk must not fill the log. Any thread may call.
class SystemLog {
 public:
  virtual ~SystemLog() = default;
  // False if messages of this level are discarded; their text then need not be made.
  virtual bool enabled(LogLevel level) const = 0;
  // One message, without a newline at its end.
  virtual void write(LogLevel level, std::string_view message) = 0;

  // Formats and writes a message, unless its level would go nowhere.
  template <class... Arguments>
  void message(LogLevel level, fmt::format_string<Arguments...> format, Arguments&&... arguments) {
    if (enabled(level)) write(level, fmt::format(format, std::forward<Arguments>(arguments)...));
  }
  // A fault in the program's own words: the first of its kind is written as an error, the others
  // are counted. The kind names the fault without naming what is at fault, so that there are few
  // kinds: "whitelist: malformed group".
  template <class... Arguments>
  void fault(std::string_view kind, fmt::format_string<Arguments...> format,
             Arguments&&... arguments) {
    bounded(LogLevel::Error, kFaultsWritten, kind, format, std::forward<Arguments>(arguments)...);
  }
  // The same for any level: the first `most` messages of a kind are written.
  template <class... Arguments>
  void bounded(LogLevel level, std::uint64_t most, std::string_view kind,
               fmt::format_string<Arguments...> format, Arguments&&... arguments) {
    if (enabled(level) && admit(level, most, kind)) {
      write(level, fmt::format(format, std::forward<Arguments>(arguments)...));
    }
  }
  // A message of a fixed text when input decides how often it comes.
  template <class... Arguments>
  void repeated(LogLevel level, std::string_view kind, fmt::format_string<Arguments...> format,
                Arguments&&... arguments) {
    bounded(level, kRepeatsWritten, kind, format, std::forward<Arguments>(arguments)...);
  }
  // Writes for each kind how many messages were left out since the last call: "KIND: 17 more".
  void writeOmitted();

  // How many messages of a fixed text are written when input decides how many there are.
  static constexpr std::uint64_t kRepeatsWritten = 100;

 protected:
  enum class Repeats { Bounded, All };
  explicit SystemLog(Repeats repeats = Repeats::Bounded) : repeats_(repeats) {}

 private:
  struct Kind {
    LogLevel level;
    std::uint64_t written = 0, omitted = 0;
  };
  static constexpr std::uint64_t kFaultsWritten = 1;

  bool admit(LogLevel level, std::uint64_t most, std::string_view kind);

  const Repeats repeats_;
  std::mutex counting_;  // of the kinds
  std::map<std::string, Kind, std::less<>> kinds_;
};

// The kind of a fault by its service and, where a system call failed, by its reason, so that a full
// disk does not hide another fault of the same service.
std::string faultKind(std::string_view service, const Error& error);

}  // namespace tally
