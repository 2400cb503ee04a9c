#include "host/kernel/sources/disk.h"

#include <algorithm>

#include "base/natural_order.h"
#include "host/kernel/channel_table.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

constexpr std::size_t kFields = rowsOf(KernelSource::Disk).size();
// Those in sectors: read, written, discarded.
constexpr std::size_t kSectorFields[] = {2, 6, 13};

// Loop, memory and mapped disks would count the same bytes twice: only what has a device of its
// own is one.
bool isPhysical(const SystemTree& tree, const std::string& directory) {
  return tree.exists(directory + "/device");
}

}  // namespace

void parseDiskStatistics(std::string_view text, const FileLayout&, std::span<std::int64_t> fields) {
  std::string_view line = text.substr(0, text.find('\n'));
  for (std::size_t i = 0; i < fields.size(); ++i) {
    const std::string_view word = takeWord(line);
    if (word.empty()) return;
    const bool inSectors = std::ranges::find(kSectorFields, i) != std::end(kSectorFields);
    fields[i] = inSectors ? scaled(counterOf(word), 1, 2) : counterOf(word);
  }
}

void findDisks(const SystemTree& tree, Findings& findings) {
  struct Disk {
    std::string busPath, name;
  };
  std::vector<Disk> disks;
  for (const std::string& name : tree.list("/sys/block")) {
    const std::string directory = "/sys/block/" + name;
    if (!isPhysical(tree, directory)) continue;
    disks.push_back({tree.resolve(directory).value_or(directory), name});
  }
  std::ranges::sort(disks, [](const Disk& a, const Disk& b) {
    return a.busPath != b.busPath ? naturalLess(a.busPath, b.busPath) : a.name < b.name;
  });
  for (unsigned ordinal = 0; ordinal < disks.size(); ++ordinal) {
    const std::string& name = disks[ordinal].name;
    const std::string directory = "/sys/block/" + name;
    // A disk that was taken away and came back counts anew.
    const std::string made = tree.text(directory + "/diskseq").value_or("");
    const std::uint32_t file = findings.addFile(KernelSource::Disk, directory + "/stat",
                                                parseDiskStatistics, {{name}, kFields});
    findings.addSimple(rowsOf(KernelSource::Disk), {name, made, ordinal}, file);
  }
}

}  // namespace tally
