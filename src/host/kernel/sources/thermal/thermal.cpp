#include "host/kernel/sources/thermal/thermal.h"

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

// Named by their type: their numbers are given out anew at each boot. They have no parent, but
// some have a device.
std::vector<NamedDevice> thermalDevices(const SystemTree& tree, std::string_view stem) {
  std::vector<DeviceCandidate> devices;
  for (const std::string& name : tree.list("/sys/class/thermal")) {
    if (!name.starts_with(stem)) continue;
    const std::string directory = "/sys/class/thermal/" + name;
    const std::string device = directory + "/device";
    devices.push_back({directory, tree.text(directory + "/type").value_or(std::string(stem)),
                       busPathOf(tree, tree.exists(device) ? device : directory)});
  }
  return named(std::move(devices));
}

}  // namespace

void findThermalZones(const SystemTree& tree, Findings& findings) {
  for (const auto& [directory, device] : thermalDevices(tree, "thermal_zone")) {
    findings.addNumbers(tree, directory, rowsOf(KernelSource::ThermalZone), device, parseGauge);
  }
}

void findCoolingDevices(const SystemTree& tree, Findings& findings) {
  constexpr auto kRows = rowsOf(KernelSource::Cooling);
  for (const auto& [directory, device] : thermalDevices(tree, "cooling_device")) {
    findings.addNumbers(tree, directory, kRows.first(2), device, parseGauge);
    const std::string statistics = directory + "/stats";
    findings.addNumbers(tree, statistics, kRows.subspan(2, 1), device, parseCounter);
    const std::string path = statistics + "/time_in_state_ms";
    FileLayout layout;
    eachLine(tree.text(path, 1u << 16).value_or(""), [&](std::string_view line) {
      const std::string_view state = takeWord(line);
      if (!state.empty()) layout.labels.emplace_back(state);
    });
    findings.addResidencies(kRows[3], device, path, parseNamedNumbers, std::move(layout));
  }
}

}  // namespace tally
