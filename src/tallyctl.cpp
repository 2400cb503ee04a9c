// tallyctl: the operator's tool.
#include <span>

#include "base/process.h"
#include "host/host_platform.h"
#include "host/system/environment.h"
#include "host/system/standard_streams.h"
#include "tools/frame/tool.h"
#include "tools/frame/tool_log.h"

int main(int count, char** arguments) {
  using namespace tally;
  surviveFailedWrites();
  prepareStandardStreams();
  tools::ToolContext context;
  context.root = deviceRootFromEnvironment();
  context.output = terminalOf(1);
  context.errors = terminalOf(2);
  return tools::runTool(std::move(context), {arguments, static_cast<std::size_t>(count)},
                        [](const tools::ToolContext& tool) {
                          const DeviceRoot root(tool.root);
                          return makeHostPlatform(
                              root, {tools::makeToolLog(stderr), /*readOnlyPreferences=*/true,
                                     std::make_shared<const SystemTree>(root, tool.play)});
                        });
}
