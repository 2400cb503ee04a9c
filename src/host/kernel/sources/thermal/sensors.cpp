#include "host/kernel/sources/thermal/sensors.h"

#include <algorithm>

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

// "temp1" of "temp1_input", if that is the input of a row's kind of sensor.
std::string_view sensorOf(std::string_view file, const ChannelRow& row) {
  constexpr std::string_view kInput = "_input";
  const std::string_view pattern = fileName(row.file);
  const std::string_view kind = pattern.substr(0, pattern.find('*'));
  if (!file.starts_with(kind) || !file.ends_with(kInput)) return {};
  const std::string_view sensor = file.substr(0, file.size() - kInput.size());
  return sensor.size() > kind.size() && counterOf(sensor.substr(kind.size())) != kNoReading
             ? sensor
             : std::string_view();
}

}  // namespace

void findSensors(const SystemTree& tree, Findings& findings) {
  std::vector<DeviceCandidate> chips;
  for (const std::string& name : tree.list("/sys/class/hwmon")) {
    const std::string directory = "/sys/class/hwmon/" + name;
    const std::string place = tree.resolve(directory).value_or("");
    // A zone's sensor is the zone once more.
    const bool isZone = place.find("/thermal_zone") != std::string::npos;
    chips.push_back({directory,
                     tree.text(directory + "/name").value_or("unnamed"),
                     busPathOf(tree, directory),
                     {},
                     !isZone});
  }
  // In the sweep the first temperature of a chip stands for all of them; a fan is a device.
  unsigned temperatures = 0, fans = 0;
  for (auto& [directory, chip] : named(std::move(chips))) {
    const bool isSwept = chip.ordinal.has_value();
    bool hasTemperature = false;
    for (const std::string& file : tree.list(directory)) {
      for (const ChannelRow& row : rowsOf(KernelSource::Sensor)) {
        const std::string_view sensor = sensorOf(file, row);
        if (sensor.empty()) continue;
        chip.ordinal.reset();
        if (row.unit == unit::kMillidegrees) {
          if (isSwept && !hasTemperature) chip.ordinal = temperatures++;
          hasTemperature = true;
        } else if (isSwept && !row.daily.empty()) {
          chip.ordinal = fans++;
        }
        const auto number =
            findings.addFile(row.source, directory + "/" + file, parseGauge, {{""}, 1});
        findings.addChannel({&row, chip, 1, {{number, 0}}, {}, std::string(sensor)});
      }
    }
  }
}

}  // namespace tally
