// The command line: parsing it, and reading back how the commands were declared.
#pragma once

#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "tools/frame/command_help.h"
#include "tools/frame/tool.h"

namespace tally::tools {

// Why the arguments were refused.
struct ParseFault {
  enum class Kind { Mismatch, Required, Extra, Other } kind = Kind::Other;
  std::string text;               // of the parser
  std::vector<std::string> rest;  // words that it could not use
};

// All commands of tallyctl. The context outlives the line.
class CommandLine {
 public:
  explicit CommandLine(ToolContext& context);
  ~CommandLine();
  CommandLine(const CommandLine&) = delete;
  CommandLine& operator=(const CommandLine&) = delete;

  // The arguments with "--" before the words that are another command's line, if the command takes
  // one. Borrows them.
  std::vector<const char*> separated(std::span<const char* const> arguments) const;

  enum class Request { Command, Help, Version, Refused };
  // Chooses a command: context.command. When refused, fault() says why.
  Request parse(std::span<const char* const> arguments);
  const ParseFault& fault() const { return fault_; }

  const CLI::App& app() const { return *app_; }
  // The command of the parsed line that is furthest from the app: what --help is about.
  const CLI::App& chosen() const;

 private:
  std::unique_ptr<CLI::App> app_;
  ParseFault fault_;
};

CommandHelp describe(const CLI::App& app);
// The command of this name below the app; null when there is none.
const CLI::App* findCommand(const CLI::App& app, std::string_view name);

}  // namespace tally::tools
