#include "host/system/system_log.h"

#include <fmt/core.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <optional>

#include "base/printable.h"
#include "base/utf8.h"
#include "host/system/environment.h"
#include "host/system/journal_socket.h"

namespace tally {
namespace {

constexpr std::size_t kLongestMessage = 16384;

struct LevelName {
  LogLevel level;
  std::string_view name;
  std::string_view priority;  // the journal's
};
constexpr std::array kLevels{
    LevelName{LogLevel::Debug, "debug", "7"},
    LevelName{LogLevel::Info, "info", "6"},
    LevelName{LogLevel::Default, "default", "5"},
    LevelName{LogLevel::Error, "error", "3"},
};

const LevelName& levelName(LogLevel level) { return kLevels[static_cast<std::size_t>(level)]; }

bool isThere(std::string_view socket) { return ::access(std::string(socket).c_str(), W_OK) == 0; }

// What may stand in a line of an environment variable.
std::string shortText(std::string_view value) {
  constexpr std::size_t kShown = 40;
  return printable(repairUtf8(value.substr(0, kShown))) + (value.size() > kShown ? "..." : "");
}

// The message as valid UTF-8 of bounded length.
std::string readable(std::string_view message) {
  std::string text = repairUtf8(message.substr(0, kLongestMessage));
  if (message.size() > kLongestMessage) text += " [cut short]";
  return text;
}

void writeToStandardError(std::string_view line) {
  while (!line.empty()) {
    const auto count = ::write(STDERR_FILENO, line.data(), line.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return;  // there is nowhere left to report it
    line.remove_prefix(static_cast<std::size_t>(count));
  }
}

class LinuxSystemLog final : public SystemLog {
 public:
  explicit LinuxSystemLog(SystemLogSettings settings) : settings_(settings) {}

  bool enabled(LogLevel level) const override { return level >= settings_.lowest; }

  void write(LogLevel level, std::string_view message) override {
    if (!enabled(level)) return;
    if (!useJournal() || !sendToJournal(level, message)) {
      writeToStandardError(standardErrorLine(level, message, settings_.identifier));
    }
  }

 private:
  bool useJournal() {
    std::call_once(looked_, [this] {
      if (!settings_.forceStandardError && isThere(settings_.journal)) {
        journal_.emplace(std::string(settings_.journal));
      }
    });
    return journal_.has_value();
  }

  bool sendToJournal(LogLevel level, std::string_view message) {
    const std::string text = readable(message);
    return journal_->send(journalEntry(std::array{
        JournalField{"MESSAGE", text}, JournalField{"PRIORITY", levelName(level).priority},
        JournalField{"SYSLOG_IDENTIFIER", settings_.identifier},
        JournalField{"SUBSYSTEM", "vellum.tallyd.tallyrun"}}));
  }

  SystemLogSettings settings_;
  std::once_flag looked_;
  std::optional<JournalSocket> journal_;
};

}  // namespace

SystemLogSettings systemLogSettings(const char* destination, const char* level) {
  SystemLogSettings settings;
  settings.forceStandardError = destination != nullptr && std::strcmp(destination, "stderr") == 0;
  if (settings.forceStandardError) settings.lowest = LogLevel::Debug;
  for (const LevelName& known : kLevels) {
    if (level != nullptr && known.name == level) settings.lowest = known.level;
  }
  return settings;
}

SystemLogEnvironment systemLogEnvironment() {
  const std::string destination = environmentVariable("TALLYRUN_LOG");
  const std::string level = environmentVariable("TALLYRUN_LOG_LEVEL");
  SystemLogEnvironment found{systemLogSettings(destination.c_str(), level.c_str()), ""};
  if (!destination.empty() && !found.settings.forceStandardError) {
    found.fault =
        fmt::format("TALLYRUN_LOG is neither empty nor stderr but {}", shortText(destination));
  } else if (!level.empty() && levelText(found.settings.lowest) != level) {
    found.fault = fmt::format("TALLYRUN_LOG_LEVEL is not debug, info, default or error but {}",
                              shortText(level));
  }
  return found;
}

std::string_view levelText(LogLevel level) { return levelName(level).name; }

bool journalIsThere() { return isThere(kJournalSocket); }

std::shared_ptr<SystemLog> makeLinuxSystemLog(SystemLogSettings settings) {
  return std::make_shared<LinuxSystemLog>(settings);
}

std::string standardErrorLine(LogLevel level, std::string_view message,
                              std::string_view identifier) {
  std::string line(identifier);
  line += '[';
  line += levelName(level).name;
  line += "]: ";
  line += printable(readable(message));
  line += '\n';
  return line;
}

std::shared_ptr<SystemLog> makeSystemLogOfEnvironment(std::string_view identifier) {
  SystemLogEnvironment environment = systemLogEnvironment();
  environment.settings.identifier = identifier;
  auto log = makeLinuxSystemLog(environment.settings);
  if (!environment.fault.empty()) {
    log->fault("environment", "{}; the messages are those of level {}", environment.fault,
               levelText(environment.settings.lowest));
  }
  return log;
}

}  // namespace tally
