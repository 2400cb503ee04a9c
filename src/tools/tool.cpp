#include "tools/tool.h"

#include <CLI/CLI.hpp>
#include <sstream>

namespace tally::tools {
namespace {

int report(const CLI::App& app, const CLI::ParseError& error, const ToolContext& context) {
  std::ostringstream out, err;
  const bool asked = app.exit(error, out, err) == kSuccess;  // --help is not an error
  print(context.out, out.str());
  print(context.err, err.str());
  return asked ? kSuccess : kBadUsage;
}

}  // namespace

int runTool(ToolContext context, std::span<const char* const> arguments,
            const PlatformFactory& makePlatform) {
  CLI::App app("Looks into a device's analytics: what is stored, what is reported, and why.",
               "tallyctl");
  app.require_subcommand(1);
  app.footer("Exit status: 0 success, 1 what was asked about is wrong or missing, 2 bad usage.");
  app.fallthrough();  // the common options may follow the command
  app.add_option("--root", context.root, "Device root folder")->type_name("DIR");
  app.add_flag("--json", context.json, "Print JSON");
  for (const CommandFamily addCommands : commandFamilies()) addCommands(app, context);
  try {
    app.parse(static_cast<int>(arguments.size()), arguments.data());
  } catch (const CLI::ParseError& error) {
    return report(app, error, context);
  }
  if (!context.command) return kBadUsage;
  const PlatformScope scope(makePlatform(context.root));
  return context.command();
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
