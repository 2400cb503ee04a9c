#include "host/kernel/sources/power/sleep.h"

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

const std::string kWakeups = "/sys/class/wakeup/";

// The first that is in the path or the name decides; "/" is where a part of a path begins.
struct WakeupMark {
  std::string_view mark, kind;
};
constexpr WakeupMark kWakeupMarks[] = {
    {"/rtc", "clock"},         {"alarmtimer", "clock"}, {"PNP0C0C", "button"},
    {"PNP0C0D", "button"},     {"PNP0C0E", "button"},   {"LNXPWRBN", "button"},
    {"LNXSLPBN", "button"},    {"gpio-keys", "button"}, {"gpio_keys", "button"},
    {"power_supply", "power"}, {"PNP0C0A", "power"},    {"ACPI0003", "power"},
    {"/usb", "usb"},           {"/net/", "network"},    {"ieee80211", "network"},
    {"serio", "input"},        {"i8042", "input"},      {"/input", "input"},
    {"mmc", "storage"},        {"/ata", "storage"},     {"pci", "pci"},
};

}  // namespace

std::string_view wakeupKind(std::string_view path, std::string_view name) {
  for (const auto& [mark, kind] : kWakeupMarks) {
    const bool begins = mark.front() == '/' && name.starts_with(mark.substr(1));
    if (begins || path.find(mark) != path.npos || name.find(mark) != name.npos) return kind;
  }
  return "other";
}

void findSuspend(const SystemTree& tree, Findings& findings) {
  findings.addNumbers(tree, "/sys/power/suspend_stats", rowsOf(KernelSource::Suspend), {},
                      parseCounter);
}

void findWakeupSources(const SystemTree& tree, Findings& findings) {
  std::vector<DeviceCandidate> sources;
  for (const std::string& entry : tree.list(kWakeups)) {
    const std::string directory = kWakeups + entry;
    const std::string name = tree.text(directory + "/name").value_or("unnamed");
    std::string path = busPathOf(tree, directory);
    sources.push_back({directory, name, path, {}, true, wakeupKind(path, name)});
  }
  for (const auto& [directory, device] : named(std::move(sources))) {
    findings.addNumbers(tree, directory, rowsOf(KernelSource::WakeupSource), device, parseCounter);
  }
}

}  // namespace tally
