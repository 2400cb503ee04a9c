#include "host/kernel/sources/cpu/processors.h"

#include <algorithm>
#include <set>

#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

const std::string kProcessors = "/sys/devices/system/cpu/";

std::vector<std::string> membersOf(const SystemTree& tree, const std::string& directory,
                                   std::string_view stem) {
  std::vector<std::string> names = tree.list(directory);
  std::erase_if(names, [&](const std::string& name) {
    return !name.starts_with(stem) || counterOf(name.substr(stem.size())) == kNoReading;
  });
  return names;
}

}  // namespace

void parseTimeInFrequency(std::string_view text, const FileLayout& layout,
                          std::span<std::int64_t> fields) {
  parseNamedNumbers(text, layout, fields);
  for (std::int64_t& field : fields) field = scaled(field, kMillisecondsPerTick);
}

void findIdleStates(const SystemTree& tree, Findings& findings) {
  const ChannelRow& row = rowsOf(KernelSource::ProcessorIdle).front();
  for (const std::string& processor : membersOf(tree, kProcessors, "cpu")) {
    const std::string directory = kProcessors + processor + "/cpuidle";
    FoundChannel channel{&row, {processor}, 0, {}, {}};
    for (const std::string& state : membersOf(tree, directory, "state")) {
      const std::string path = directory + "/" + state;
      const std::uint64_t id = stateID(tree.text(path + "/name").value_or(state));
      const auto addSlot = [&](const char* file, std::size_t slot) {
        const std::uint32_t number =
            findings.addFile(row.source, path + file, parseCounter, {{""}, 1});
        channel.slots.push_back({number, 0, channel.elements, static_cast<std::uint16_t>(slot)});
      };
      addSlot("/usage", state_slot::kInTransitions);
      addSlot("/time", state_slot::kResidency);
      channel.constants.push_back({channel.elements, state_slot::kID, id ? id : stateID(state)});
      ++channel.elements;
    }
    if (channel.elements > 0) findings.addChannel(std::move(channel));
  }
}

void findFrequencies(const SystemTree& tree, Findings& findings) {
  const auto rows = rowsOf(KernelSource::ProcessorFrequency);
  std::set<std::string> seen;
  for (const std::string& processor : membersOf(tree, kProcessors, "cpu")) {
    const std::string directory = kProcessors + processor + "/cpufreq";
    // Those that share a clock lead to the same place: the first one stands for them.
    const auto place = tree.resolve(directory);
    if (!place || !seen.insert(*place).second) continue;
    const FoundDevice device{processor};
    findings.addNumbers(tree, directory, rows.subspan(1, 1), device, parseGauge);
    findings.addNumbers(tree, directory + "/stats", rows.subspan(2, 1), device, parseCounter);
    const std::string path = directory + "/stats/time_in_state";
    FileLayout layout;
    eachLine(tree.text(path, 1u << 16).value_or(""), [&](std::string_view line) {
      const std::string_view frequency = takeWord(line);
      if (counterOf(frequency) != kNoReading) layout.labels.emplace_back(frequency);
    });
    findings.addResidencies(rows.front(), device, path, parseTimeInFrequency, std::move(layout));
  }
}

void findThrottling(const SystemTree& tree, Findings& findings) {
  for (const std::string& processor : membersOf(tree, kProcessors, "cpu")) {
    findings.addNumbers(tree, kProcessors + processor + "/thermal_throttle",
                        rowsOf(KernelSource::ProcessorThrottling), {processor}, parseCounter);
  }
}

}  // namespace tally
