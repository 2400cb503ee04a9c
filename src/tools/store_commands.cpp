#include "tools/store_commands.h"

namespace tally::tools {

void addStoreCommands(CLI::App& app, ToolContext&) {
  app.add_subcommand("store", "Write and read the metrics store")->require_subcommand(1);
}

}  // namespace tally::tools
