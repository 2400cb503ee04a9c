#include "host/kernel/sources/system/memory_errors.h"

#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"

namespace tally {

void findMemoryErrors(const SystemTree& tree, Findings& findings) {
  const std::string controllers = "/sys/devices/system/edac/mc/";
  for (const std::string& name : tree.list(controllers)) {
    if (!name.starts_with("mc") || counterOf(name.substr(2)) == kNoReading) continue;
    findings.addNumbers(tree, controllers + name, rowsOf(KernelSource::MemoryErrors), {name},
                        parseCounter);
  }
}

}  // namespace tally
