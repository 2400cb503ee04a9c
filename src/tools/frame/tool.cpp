#include "tools/frame/tool.h"

#include <fmt/core.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <nlohmann/json.hpp>

#include "base/version.h"
#include "tools/frame/command_help.h"
#include "tools/frame/command_line.h"
#include "tools/frame/output.h"
#include "tools/frame/usage_error.h"

namespace tally::tools {
namespace {

bool asksForJson(std::span<const char* const> arguments) {
  const auto end = std::ranges::find(arguments, std::string_view("--"));
  return std::find(arguments.begin(), end, std::string_view("--json")) != end;
}

int runCommand(ToolContext& context, CommandLine& line, std::span<const char* const> arguments,
               const PlatformFactory& makePlatform) {
  switch (line.parse(arguments)) {
    case CommandLine::Request::Help:
      print(context.out, helpText(describe(line.chosen()), context.output));
      return kSuccess;
    case CommandLine::Request::Version:
      if (context.json) {
        printJson(context, {{"program", "tallyctl"}, {"version", kProgramVersion}});
      } else {
        print(context.out, fmt::format("tallyctl {}\n", kProgramVersion));
      }
      return kSuccess;
    case CommandLine::Request::Refused:
      return complain(context, usageFault(line.app(), arguments, line.fault()), kBadUsage);
    case CommandLine::Request::Command:
      break;
  }
  // The libraries hwreport and storage find the platform in force; commands are handed it.
  PlatformScope scope(makePlatform(context));
  context.platform = &scope.services();
  return context.command();
}

// Checks the output of every command, so that no command has to.
int finishOutput(const ToolContext& context, int status) {
  const bool failed = std::ferror(context.out) != 0;
  // What is left in the buffer after a failure fails once more, for the same reason.
  const int fault = std::fflush(context.out) != 0 ? errno : 0;
  if (!failed && fault == 0) return status;
  const std::string reason = fault != 0 ? fmt::format(": {}", std::strerror(fault)) : "";
  return complain(context, "cannot write to standard output" + reason, kWrong);
}

// One object for every failure, whatever the command printed before.
void reportFailure(const ToolContext& context, int status) {
  std::string message;
  for (const std::string& complaint : *context.complaints) {
    message.append(message.empty() ? "" : "; ").append(complaint);
  }
  if (message.empty()) message = "what was asked about is wrong or missing";
  const Json error = {{"error", {{"status", status}, {"message", message}}}};
  print(context.err,
        printableJson(error.dump(-1, ' ', false, Json::error_handler_t::replace)) + "\n");
}

}  // namespace

int runTool(ToolContext context, std::span<const char* const> arguments,
            const PlatformFactory& makePlatform) {
  std::vector<std::string> complaints;
  context.complaints = &complaints;
  CommandLine line(context);
  const std::vector<const char*> words = line.separated(arguments);
  context.json = asksForJson(words);  // also for what is wrong with the arguments themselves
  const int status = finishOutput(context, runCommand(context, line, words, makePlatform));
  if (!context.json) return status;
  if (status != kSuccess) {
    reportFailure(context, status);
  } else {
    context.json = false;  // what did not make the command fail is for people
    for (const std::string& complaint : complaints) complain(context, complaint, kSuccess);
  }
  return status;
}

void print(std::FILE* file, std::string_view text) {
  std::fwrite(text.data(), 1, text.size(), file);
}

}  // namespace tally::tools
