#include "host/system/log_header_facts.h"

#include <errno.h>
#include <fmt/core.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <random>

#include "base/printable.h"
#include "base/text_lines.h"

namespace tally {
namespace {

// Firmware tables first, then the tree that boards are described by, whose texts end in a zero.
constexpr const char* kModelFiles[] = {"/sys/devices/virtual/dmi/id/product_name",
                                       "/sys/firmware/devicetree/base/model"};

std::string runningKernel(const SystemTree& tree) {
  if (tree.isRecording()) {
    std::string text;
    for (const char* const name : {"ostype", "osrelease", "arch"}) {
      const auto part = tree.text("/proc/sys/kernel/" + std::string(name));
      if (part && !part->empty()) text.append(text.empty() ? "" : " ").append(*part);
    }
    return text.empty() ? "unknown" : text;
  }
  struct utsname names {};
  if (::uname(&names) != 0) return "unknown";
  return fmt::format("{} {} {}", names.sysname, names.release, names.machine);
}

std::string hardwareModel(const SystemTree& tree) {
  for (const char* const path : kModelFiles) {
    const auto text = tree.fact(path);
    if (!text) continue;
    const std::string_view line =
        std::string_view(*text).substr(0, text->find_first_of(std::string_view("\n\0", 2)));
    if (!trimmed(line).empty()) return std::string(trimmed(line));
  }
  return "unknown";
}

}  // namespace

std::string LinuxLogHeaderFacts::describedOr(DescribedAs<KvString> entry, const std::string& text) {
  if (const auto* described = description_->getAs<KvString>(entry)) {
    if (!described->view().empty()) return printable(described->view());
    description_->reportEntry(entry.entry, "is empty");
  }
  return printable(text);
}

std::string LinuxLogHeaderFacts::SysIdDescription() {
  return describedOr(Described::SystemID, runningKernel(*tree_));
}

std::string LinuxLogHeaderFacts::HardwareModelString() {
  return describedOr(Described::HardwareModel, hardwareModel(*tree_));
}

std::string LinuxLogHeaderFacts::SystemVersionString() {
  return printable(device_->SMAOSVersion());
}

// A random identifier of version 4.
std::string LinuxLogHeaderFacts::NewIncidentID() {
  std::random_device random;
  const auto word = [&random] { return static_cast<std::uint32_t>(random()); };
  const std::uint32_t second = word(), third = word();
  return fmt::format("{:08X}-{:04X}-4{:03X}-{:04X}-{:04X}{:08X}", word(), second >> 16,
                     second & 0xFFF, (third >> 16 & 0x3FFF) | 0x8000, third & 0xFFFF, word());
}

std::string LinuxLogHeaderFacts::processName() { return printable(program_invocation_short_name); }

std::int32_t LinuxLogHeaderFacts::processIdentifier() { return ::getpid(); }

}  // namespace tally
