#include "tools/storage/nand_command.h"

#include "storage/exporter.h"
#include "tools/frame/output.h"

namespace tally::tools {

bool hasStorageDriver(const ToolContext& context) {
  const NandExporter* exporter = nullptr;
  const RegistryHandle service = findNandExporter(&exporter);
  if (service != 0) context.platform->deviceRegistry->HandleRelease(service);
  return service != 0;
}

int complainOfNoDriver(const ToolContext& context) {
  return complain(context, "this device has no driver that exports figures of its flash storage",
                  kWrong);
}

Command addNandCommand(CLI::App& nand, ToolContext& context, const char* name,
                       const char* description, std::function<int()> run) {
  const Command command =
      addCommand(nand, context, name, description, [&context, run = std::move(run)] {
        return hasStorageDriver(context) ? run() : complainOfNoDriver(context);
      });
  command.canPlay();
  return command;
}

}  // namespace tally::tools
