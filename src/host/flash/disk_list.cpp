#include "host/flash/disk_list.h"

#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>

#include "host/flash/mount_table.h"
#include "host/flash/nvme.h"
#include "host/flash/ufs.h"

namespace tally {
namespace {

constexpr std::string_view kDataPath = "/var/mobile";
constexpr int kMostLayers = 16;  // between a file and its disk
constexpr std::size_t kLargestMountTable = 1u << 20;

std::string blockFolder(std::string_view name) { return "/sys/block/" + std::string(name); }

bool isNumbered(std::string_view name, std::string_view prefix) {
  return name.starts_with(prefix) && name.size() > prefix.size() &&
         name.find_first_not_of("0123456789", prefix.size()) == std::string_view::npos;
}

// "nvme0n1", but not the single paths of a disk that has several ("nvme0c0n1").
bool isNvmeNamespace(std::string_view name) {
  const std::size_t n = name.starts_with("nvme") ? name.find('n', 4) : std::string_view::npos;
  return n != std::string_view::npos && isNumbered(name.substr(0, n), "nvme") &&
         isNumbered(name.substr(n), "n");
}

std::optional<Disk> parseDisk(const SystemTree& tree, const std::string& name) {
  Disk disk{name, DiskKind::Other, tree.text(blockFolder(name) + "/removable") == "1", ""};
  if (isNumbered(name, "mmcblk")) {
    // SD cards lie in the same place.
    if (tree.text(blockFolder(name) + "/device/type") == "MMC") {
      disk.kind = DiskKind::Emmc;
    } else {
      disk.isRemovable = true;
    }
    return disk;
  }
  if (isNvmeNamespace(name)) {
    disk.kind = DiskKind::Nvme;
    disk.controller = nvmeController(tree, name);
    return disk;
  }
  // Layers above a disk have no device, memory technology devices are listed as UBI.
  if (name.starts_with("mmcblk") || name.starts_with("nvme") || name.starts_with("mtdblock") ||
      name.starts_with("sr") || !tree.exists(blockFolder(name) + "/device")) {
    return std::nullopt;
  }
  if (name.starts_with("sd")) {
    disk.controller = ufsController(tree, name);
    if (!disk.controller.empty()) disk.kind = DiskKind::Ufs;
  }
  return disk;
}

// From a place of the tree down to a disk. Each step takes one layer off.
class Descent {
 public:
  Descent(const SystemTree& tree, const std::vector<Disk>& disks)
      : tree_(tree),
        disks_(disks),
        mounts_(tree.text("/proc/self/mountinfo", kLargestMountTable)) {}

  std::string ofPath(const std::string& path, int layers = 0) const {
    const auto mount = mounts_ ? mountOf(*mounts_, path) : std::nullopt;
    if (!mount || layers > kMostLayers) return {};
    if (const std::string ubi = known(ubiDeviceOf(mount->source)); !ubi.empty()) return ubi;
    if (mount->hasBlockDevice()) return ofBlock(blockDeviceOf(tree_, mount->device), layers + 1);
    // An overlay keeps its changes in a directory of another mount.
    const std::string upper = mountOption(mount->options, "upperdir");
    if (!upper.empty()) return ofPath(upper, layers + 1);
    constexpr std::string_view kDevices = "/dev/";
    if (!mount->source.starts_with(kDevices)) return {};
    return ofBlock(mapped(mount->source.substr(kDevices.size())), layers + 1);
  }

  std::string ofBlock(const std::string& name, int layers) const {
    if (name.empty() || layers > kMostLayers) return {};
    if (const std::string disk = known(name); !disk.empty()) return disk;
    if (name.starts_with("mtdblock")) return ubiOnMtd(name.substr(8));
    for (const Disk& disk : disks_) {
      if (tree_.exists(blockFolder(disk.name) + "/" + name + "/partition")) return disk.name;
    }
    // A partition of what is not a disk itself, such as an array.
    for (const std::string& whole : tree_.list("/sys/block")) {
      if (name.starts_with(whole) && tree_.exists(blockFolder(whole) + "/" + name + "/partition")) {
        return ofBlock(whole, layers + 1);
      }
    }
    for (const std::string& below : tree_.list(blockFolder(name) + "/slaves")) {
      const std::string disk = ofBlock(below, layers + 1);
      if (!disk.empty()) return disk;
    }
    const auto file = tree_.text(blockFolder(name) + "/loop/backing_file");
    return file && file->starts_with('/') ? ofPath(*file, layers + 1) : "";
  }

 private:
  std::string known(const std::string& name) const {
    return std::ranges::any_of(disks_, [&](const Disk& disk) { return disk.name == name; }) ? name
                                                                                            : "";
  }
  // "mapper/data" is "dm-0".
  std::string mapped(const std::string& name) const {
    constexpr std::string_view kMapper = "mapper/";
    if (!name.starts_with(kMapper)) return name;
    for (const std::string& block : tree_.list("/sys/block")) {
      if (tree_.text(blockFolder(block) + "/dm/name") == name.substr(kMapper.size())) return block;
    }
    return {};
  }
  std::string ubiOnMtd(const std::string& number) const {
    for (const Disk& disk : disks_) {
      if (disk.kind == DiskKind::RawNand &&
          tree_.text("/sys/class/ubi/" + disk.name + "/mtd_num") == number) {
        return disk.name;
      }
    }
    return {};
  }

  const SystemTree& tree_;
  const std::vector<Disk>& disks_;
  std::optional<std::string> mounts_;
};

// The number of the block device of the data on this machine; empty where the file system has none.
std::string dataDeviceNumber() {
  struct stat status {};
  // Where it is not there yet, it will be made on the volume above.
  for (std::string path(kDataPath); ::stat(path.c_str(), &status) != 0;) {
    path.resize(path.rfind('/'));
    if (path.empty()) return {};
  }
  if (major(status.st_dev) == 0) return {};
  return std::to_string(major(status.st_dev)) + ":" + std::to_string(minor(status.st_dev));
}

}  // namespace

std::vector<Disk> listDisks(const SystemTree& tree) {
  std::vector<Disk> disks;
  for (const std::string& name : tree.list("/sys/block")) {
    if (auto disk = parseDisk(tree, name)) disks.push_back(std::move(*disk));
  }
  for (const std::string& name : tree.list("/sys/class/ubi")) {
    if (isNumbered(name, "ubi") && tree.exists("/sys/class/ubi/" + name + "/max_ec")) {
      disks.push_back({name, DiskKind::RawNand, false, ""});
    }
  }
  return disks;
}

std::string blockDeviceOf(const SystemTree& tree, std::string_view number) {
  if (number.empty()) return {};
  for (const std::string& disk : tree.list("/sys/block")) {
    if (tree.text(blockFolder(disk) + "/dev") == number) return disk;
    for (const std::string& part : tree.list(blockFolder(disk))) {
      if (part.starts_with(disk) && tree.text(blockFolder(disk) + "/" + part + "/dev") == number) {
        return part;
      }
    }
  }
  return {};
}

std::string deviceDisk(const SystemTree& tree, const std::vector<Disk>& disks) {
  const Descent descent(tree, disks);
  std::string disk;
  if (tree.isThisMachine()) disk = descent.ofBlock(blockDeviceOf(tree, dataDeviceNumber()), 0);
  if (disk.empty()) {
    disk = descent.ofPath(tree.resolve(std::string(kDataPath)).value_or(std::string(kDataPath)));
  }
  if (!disk.empty()) return disk;
  const auto isFixed = [](const Disk& one) { return !one.isRemovable; };
  if (std::ranges::count_if(disks, isFixed) != 1) return {};
  return std::ranges::find_if(disks, isFixed)->name;
}

}  // namespace tally
