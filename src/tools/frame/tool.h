// What every command of tallyctl shares: the device, the form of the output and the exit status.
#pragma once

#include <cstdio>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "host/system/terminal.h"
#include "platform/platform.h"

namespace CLI {
class App;
}

namespace tally::tools {

enum ExitStatus : int {
  kSuccess = 0,
  kWrong = 1,     // the thing asked about is wrong or missing
  kBadUsage = 2,  // the command line makes no sense
};

struct ToolContext {
  std::string root;   // the device root: --root, else what it was built with
  bool json = false;  // --json: output for programs
  Terminal output;    // what standard output can show
  Terminal errors;    // what standard error can show
  std::FILE* out = stdout;
  std::FILE* err = stderr;
  // The services of the device root, while a command runs; borrowed.
  Platform* platform = nullptr;
  // What went wrong, for the error object of --json; borrowed.
  std::vector<std::string>* complaints = nullptr;
  // The command that the arguments chose, set by the callback of its CLI::App. It runs once the
  // platform of the root is installed, and returns the exit status.
  std::function<int()> command;
};

// Each family of commands adds its own subcommands with a function of this form, declared in its
// own header and listed in commandFamilies(). The app and the context outlive the commands.
using CommandFamily = void (*)(CLI::App& app, ToolContext& context);
std::span<const CommandFamily> commandFamilies();

// Adds a command to a family. Its options are added to what is returned; run is called when the
// arguments chose it.
CLI::App* addCommand(CLI::App* family, ToolContext& context, const char* name,
                     const char* description, std::function<int()> run);

// Makes the platform of a device root.
using PlatformFactory = std::function<Platform(const std::string& root)>;

// Adds the commands, and the options that all of them take, to an app.
void addAllCommands(CLI::App& app, ToolContext& context);

// Runs the command that the arguments name (the first is the program's own name) and returns the
// exit status, which is kWrong where context.out could not be written. Help goes to context.out,
// usage errors to context.err. A command that fails under --json leaves one line there, the object
// {"error": {"status": ..., "message": ...}}; its result, where it has one, is on context.out.
int runTool(ToolContext context, std::span<const char* const> arguments,
            const PlatformFactory& makePlatform);

// Writes text as it is.
void print(std::FILE* file, std::string_view text);

}  // namespace tally::tools
