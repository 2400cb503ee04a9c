#include "host/kernel/sources/power/supplies.h"

#include <algorithm>

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

const std::string kSupplies = "/sys/class/power_supply";

FileParser parserOf(const ChannelRow& row) {
  if (row.unit == unit::kMicrojoules) return parseEnergy;
  if (row.unit == unit::kMillidegrees) return parseTenths;
  return fileName(row.file) == "cycle_count" ? parseCycles : parseGauge;
}

// What the battery still takes of what it took when it was new.
void addHealth(const SystemTree& tree, Findings& findings, const ChannelRow& row,
               const std::string& directory, const FoundDevice& device) {
  for (const std::string full : {"/energy_full", "/charge_full"}) {
    const std::string now = directory + full, design = now + "_design";
    if (!tree.exists(now) || !tree.exists(design)) continue;
    const std::uint32_t value = findings.addFile(row.source, now, parseCounter, {{""}, 1});
    const std::uint32_t whole = findings.addFile(row.source, design, parseCounter, {{""}, 1});
    findings.addChannel({&row, device, 1, {{value, 0, 0, 0, FoundField{whole, 0}}}, {}});
    return;
  }
}

}  // namespace

void parseEnergy(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  constexpr std::int64_t kSecondsPerHour = 3600;
  fields[0] = scaled(counterOf(trimmed(text)), kSecondsPerHour);
}

void parseTenths(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  constexpr std::int64_t kThousandthsPerTenth = 100;
  fields[0] = scaled(readingOf(trimmed(text)), kThousandthsPerTenth);
}

void parseCycles(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  const std::int64_t cycles = counterOf(trimmed(text));
  fields[0] = cycles == 0 ? kNoReading : cycles;
}

void findPowerSupplies(const SystemTree& tree, Findings& findings) {
  constexpr auto kRows = rowsOf(KernelSource::PowerSupply);
  std::vector<DeviceCandidate> supplies;
  for (const std::string& name : tree.list(kSupplies)) {
    const std::string directory = kSupplies + "/" + name;
    // The battery of a mouse or a keyboard is not this device's.
    const bool isBattery =
        tree.text(directory + "/type") == "Battery" && tree.text(directory + "/scope") != "Device";
    supplies.push_back({directory, name, busPathOf(tree, directory), {}, isBattery});
  }
  for (const auto& [directory, device] : named(std::move(supplies))) {
    addHealth(tree, findings, kRows.front(), directory, device);
    for (std::size_t i = 1; i < kRows.size(); ++i) {
      findings.addNumbers(tree, directory, kRows.subspan(i, 1), device, parserOf(kRows[i]));
    }
  }
}

}  // namespace tally
