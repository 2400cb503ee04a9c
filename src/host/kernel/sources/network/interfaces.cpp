#include "host/kernel/sources/network/interfaces.h"

#include <map>

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

constexpr std::string_view kInterfaces = "/proc/net/dev";
constexpr std::size_t kLargestText = 1u << 20;

// The interface of a line and its numbers; no name in the two lines of titles.
std::string_view takeInterface(std::string_view& line) {
  const std::size_t colon = line.rfind(':');
  if (colon == std::string_view::npos) return {};
  const std::string_view name = trimmed(line.substr(0, colon));
  line.remove_prefix(colon + 1);
  return name;
}

}  // namespace

void parseInterfaces(std::string_view text, const FileLayout& layout,
                     std::span<std::int64_t> fields) {
  std::size_t hint = 0;
  eachLine(text, [&](std::string_view line) {
    const std::string_view name = takeInterface(line);
    const std::size_t place = name.empty() ? layout.labels.size() : labelIndex(layout, name, hint);
    if (place == layout.labels.size()) return;
    for (std::size_t column = 0; column < layout.columns; ++column) {
      const std::string_view word = takeWord(line);
      if (word.empty()) return;
      fields[place * layout.columns + column] = counterOf(word);
    }
  });
}

void findInterfaces(const SystemTree& tree, Findings& findings) {
  constexpr auto kRows = rowsOf(KernelSource::Network);
  const std::string path(kInterfaces);
  const std::string text = tree.text(path, kLargestText).value_or("");
  FileLayout layout{{}, kRows.size()};
  std::map<std::string, std::uint32_t> places;
  std::vector<DeviceCandidate> interfaces;
  eachLine(text, [&](std::string_view line) {
    const std::string name(takeInterface(line));
    const auto place = static_cast<std::uint32_t>(layout.labels.size());
    // One named ".." would lead elsewhere; the kernel allows none of these.
    if (name.empty() || name.starts_with('.') || name.find('/') != std::string::npos) return;
    const std::string directory = "/sys/class/net/" + name;
    if (!places.emplace(directory, place).second) return;
    layout.labels.push_back(name);
    // An interface that was made again counts anew and has another index.
    interfaces.push_back({directory, name, busPathOf(tree, directory),
                          tree.text(directory + "/ifindex").value_or(""),
                          tree.exists(directory + "/device")});
  });
  if (interfaces.empty()) return;
  const std::uint32_t file =
      findings.addFile(KernelSource::Network, path, parseInterfaces, std::move(layout));
  for (const auto& [directory, device] : named(std::move(interfaces))) {
    const auto first = static_cast<std::uint32_t>(places[directory] * kRows.size());
    findings.addSimple(kRows, device, file, first);
  }
}

}  // namespace tally
