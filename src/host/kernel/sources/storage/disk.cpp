#include "host/kernel/sources/storage/disk.h"

#include <algorithm>

#include "host/kernel/channel_table.h"
#include "host/kernel/naming.h"
#include "host/kernel/text_fields.h"

namespace tally {
namespace {

constexpr auto kDiskRows = rowsOf(KernelSource::Disk);
// Those in sectors: read, written, discarded.
constexpr std::size_t kSectorFields[] = {2, 6, 13};

bool isNumbered(std::string_view name, std::string_view stem) {
  return name.starts_with(stem) && name.size() > stem.size() && name[stem.size()] >= '0' &&
         name[stem.size()] <= '9';
}

// Disks that are made of others would count the same bytes twice, drives of removable media are
// not what wears. Paths alone do not tell: a recording may lack the links.
bool isPhysical(const SystemTree& tree, const std::string& directory, std::string_view name) {
  constexpr std::string_view kOther[] = {"loop", "ram",      "zram", "dm-",    "md",
                                         "nbd",  "sr",       "fd",   "bcache", "rbd",
                                         "drbd", "ubiblock", "zd",   "rnbd",   "nullb"};
  if (std::ranges::any_of(kOther, [&](std::string_view stem) { return isNumbered(name, stem); }) ||
      name.starts_with("md_")) {
    return false;
  }
  // The boot areas of an eMMC, and the paths that lead to one NVMe disk.
  if (isNumbered(name, "mmcblk") && (name.find("boot") != std::string_view::npos ||
                                     name.find("rpmb") != std::string_view::npos)) {
    return false;
  }
  if (tree.text(directory + "/hidden") == "1") return false;
  if (isNumbered(name, "nvme") && name.find('c', 4) != std::string_view::npos) return false;
  const std::string path = tree.resolve(directory).value_or(directory);
  return !path.starts_with("/sys/devices/virtual/block/");
}

}  // namespace

void parseDiskStatistics(std::string_view text, const FileLayout& layout,
                         std::span<std::int64_t> fields) {
  parseNumbers(text, layout, fields);
  for (const std::size_t field : kSectorFields) {
    if (field < fields.size()) fields[field] = scaled(fields[field], 1, 2);
  }
}

void findDisks(const SystemTree& tree, Findings& findings) {
  std::vector<DeviceCandidate> disks;
  for (const std::string& name : tree.list("/sys/block")) {
    const std::string directory = "/sys/block/" + name;
    if (!isPhysical(tree, directory, name) || !tree.exists(directory + "/stat")) continue;
    // A disk that was taken away and came back counts anew.
    disks.push_back({directory,
                     name,
                     busPathOf(tree, directory),
                     tree.text(directory + "/diskseq").value_or(""),
                     !isNumbered(name, "mtdblock"),  // partitions of one chip
                     {},
                     tree.number(directory + "/removable") == 1});
  }
  for (const auto& [directory, device] : named(std::move(disks))) {
    const std::string path = directory + "/stat";
    const std::size_t known = numberCount(tree.text(path), kDiskRows.size());
    const std::uint32_t file =
        findings.addFile(KernelSource::Disk, path, parseDiskStatistics, {{""}, known});
    findings.addSimple(kDiskRows.first(known), device, file);
  }
}

}  // namespace tally
