#include "tools/storage/nand_command.h"

#include "storage/exporter.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

bool hasDriver(Platform& platform) {
  const NandExporter* exporter = nullptr;
  const RegistryHandle service = findNandExporter(&exporter);
  if (service != 0) platform.deviceRegistry->HandleRelease(service);
  return service != 0;
}

}  // namespace

Command addNandCommand(CLI::App& nand, ToolContext& context, const char* name,
                       const char* description, std::function<int()> run) {
  const Command command =
      addCommand(nand, context, name, description, [&context, run = std::move(run)] {
        if (hasDriver(*context.platform)) return run();
        return complain(
            context, "this device has no driver that exports figures of its flash storage", kWrong);
      });
  command.canPlay();
  return command;
}

}  // namespace tally::tools
