// What all commands of tallyctl share: the device, the output format and the exit status.
#pragma once

#include <cstdio>
#include <functional>
#include <map>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "host/system/terminal.h"
#include "platform/platform.h"

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace tally::tools {

enum ExitStatus : int {
  kSuccess = 0,
  kWrong = 1,     // the thing asked about is wrong or missing
  kBadUsage = 2,  // the command line is malformed
};

// What a value on the command line is: completion offers what the device has of this kind.
enum class ValueKind {
  Text,
  Number,
  StoreKey,
  Day,
  Domain,
  Preference,
  Log,
  Disk,
  File,
  Directory
};

struct ToolContext {
  std::string root;   // the device root: --root, else what it was built with
  bool json = false;  // --json: output for programs
  bool play = false;  // --play: the samples of a recording follow the clock
  Terminal output;    // what standard output can show
  Terminal errors;    // what standard error can show
  std::FILE* out = stdout;
  std::FILE* err = stderr;
  // The services of the device root, while a command runs; borrowed.
  Platform* platform = nullptr;
  // The messages for the error object of --json; borrowed.
  std::vector<std::string>* complaints = nullptr;
  // Of every declared option and argument that takes a value.
  std::map<const CLI::Option*, ValueKind> valueKinds;
  // The command that the arguments chose. It runs once the platform of the root is installed, and
  // returns the exit status.
  std::function<int()> command;
};

// Makes the platform of the context's device root.
using PlatformFactory = std::function<Platform(const ToolContext& context)>;

// Runs the command that the arguments name (the first is the program's own name) and returns the
// exit status, which is kWrong where context.out could not be written. Help goes to context.out,
// usage errors to context.err. A command that fails under --json leaves one line there, the object
// {"error": {"status": ..., "message": ...}}; its result, where it has one, is on context.out.
int runTool(ToolContext context, std::span<const char* const> arguments,
            const PlatformFactory& makePlatform);

// Writes text as it is.
void print(std::FILE* file, std::string_view text);

}  // namespace tally::tools
