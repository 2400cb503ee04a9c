// The system log: the journal, or standard error.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/system_log.h"

namespace tally {

// Of the daily job, and of the libraries in other programs.
constexpr std::string_view kLogIdentifier = "tallyrun";

// Where the machine's journal takes messages.
constexpr std::string_view kJournalSocket = "/run/systemd/journal/socket";

struct SystemLogSettings {
  bool forceStandardError = false;
  LogLevel lowest = LogLevel::Info;
  std::string_view identifier = kLogIdentifier;  // of the program, in the journal and in lines
  std::string_view journal = kJournalSocket;
};

// From the values of TALLYRUN_LOG and TALLYRUN_LOG_LEVEL; null is unset. An unknown value is
// treated as unset.
SystemLogSettings systemLogSettings(const char* destination, const char* level);

// The settings that this process runs with, and what of the two variables is not understood.
struct SystemLogEnvironment {
  SystemLogSettings settings;
  std::string fault;  // empty when both are understood or unset
};
SystemLogEnvironment systemLogEnvironment();
// "debug", "info", "default", "error".
std::string_view levelText(LogLevel level);
// Whether the machine's journal takes messages.
bool journalIsThere();

// Whether there is a journal is found out at the first message.
std::shared_ptr<SystemLog> makeLinuxSystemLog(SystemLogSettings settings);
// The one that the environment asks for; it says itself what of that is not understood.
std::shared_ptr<SystemLog> makeSystemLogOfEnvironment(std::string_view identifier = kLogIdentifier);

// A message as one line of standard error, ending in a newline: control characters are written as
// escapes ("\n", "\x1b"), so that no message can look like two, and bytes that are not UTF-8 as
// U+FFFD. Messages above 16 KiB are cut short.
std::string standardErrorLine(LogLevel level, std::string_view message,
                              std::string_view identifier = kLogIdentifier);

}  // namespace tally
