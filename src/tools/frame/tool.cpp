#include "tools/frame/tool.h"

#include <fmt/core.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <cstring>
#include <nlohmann/json.hpp>

#include "base/version.h"
#include "tools/frame/command_help.h"
#include "tools/frame/output.h"
#include "tools/frame/usage_error.h"

namespace tally::tools {
namespace {

bool asksForJson(std::span<const char* const> arguments) {
  const auto end = std::ranges::find(arguments, std::string_view("--"));
  return std::find(arguments.begin(), end, std::string_view("--json")) != end;
}

int runCommand(ToolContext& context, std::span<const char* const> arguments,
               const PlatformFactory& makePlatform) {
  CLI::App app;
  addAllCommands(app, context);
  try {
    app.parse(static_cast<int>(arguments.size()), arguments.data());
  } catch (const CLI::CallForHelp&) {
    print(context.out, helpText(chosenCommand(app), context.output));
    return kSuccess;
  } catch (const CLI::CallForVersion&) {
    if (context.json) {
      printJson(context, {{"program", "tallyctl"}, {"version", kProgramVersion}});
    } else {
      print(context.out, fmt::format("tallyctl {}\n", kProgramVersion));
    }
    return kSuccess;
  } catch (const CLI::ParseError& error) {
    return complain(context, usageFault(app, arguments, error), kBadUsage);
  }
  // The libraries hwreport and storage find the platform in force; the tool is handed it.
  const PlatformScope scope(makePlatform(context.root));
  context.platform = &platform();
  return context.command();
}

// Every command's output is checked here, so that none has to look after it.
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

void addAllCommands(CLI::App& app, ToolContext& context) {
  app.name("tallyctl");
  app.description("Inspects a device's analytics: what is stored, what is reported, and why.");
  app.set_help_flag("-h,--help", "Print this help");
  app.require_subcommand(1);
  app.fallthrough();  // the common options may stand anywhere
  app.set_version_flag("--version", std::string(kProgramVersion), "Print the version");
  app.add_option("--root", context.root, "The device root; TALLYRUN_ROOT or / by default")
      ->type_name("DIR");
  app.add_flag("--json", context.json, "Print JSON");
  for (const CommandFamily addCommands : commandFamilies()) addCommands(app, context);
}

int runTool(ToolContext context, std::span<const char* const> arguments,
            const PlatformFactory& makePlatform) {
  std::vector<std::string> complaints;
  context.complaints = &complaints;
  context.json = asksForJson(arguments);  // also for what is wrong with the arguments themselves
  const int status = finishOutput(context, runCommand(context, arguments, makePlatform));
  if (!context.json) return status;
  if (status != kSuccess) {
    reportFailure(context, status);
  } else {
    context.json = false;  // what did not make the command fail is for people
    for (const std::string& complaint : complaints) complain(context, complaint, kSuccess);
  }
  return status;
}

CLI::App* addCommand(CLI::App* family, ToolContext& context, const char* name,
                     const char* description, std::function<int()> run) {
  CLI::App* const command = family->add_subcommand(name, description);
  command->callback([&context, run = std::move(run)] { context.command = run; });
  return command;
}

void print(std::FILE* file, std::string_view text) {
  std::fwrite(text.data(), 1, text.size(), file);
}

}  // namespace tally::tools
