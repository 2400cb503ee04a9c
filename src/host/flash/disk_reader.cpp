#include "host/flash/disk_reader.h"

#include <cstdlib>

#include "host/flash/emmc.h"
#include "host/flash/nvme.h"
#include "host/flash/raw_nand.h"
#include "host/flash/ufs.h"

namespace tally {
namespace {

std::string identityText(const SystemTree& tree, const Disk& disk) {
  switch (disk.kind) {
    case DiskKind::Emmc:
      return emmcIdentity(tree, disk.name);
    case DiskKind::Ufs:
      return ufsIdentity(tree, disk.controller);
    case DiskKind::RawNand:
      return rawNandIdentity(tree, disk.name);
    case DiskKind::Nvme:
      return nvmeIdentity(tree, disk.name);
    case DiskKind::Other:
      return {};
  }
  return {};
}

}  // namespace

bool DiskReader::mayTellWear(const Disk& disk) const {
  switch (disk.kind) {
    case DiskKind::Emmc:  // one file of the kernel's memory; many cards say nothing
      return wear(disk).has_value();
    case DiskKind::Ufs:
    case DiskKind::RawNand:
      return true;
    case DiskKind::Nvme:
      return hasHealthPage(root_, disk.controller);
    case DiskKind::Other:
      return false;
  }
  return false;
}

std::optional<Wear> DiskReader::wear(const Disk& disk) const {
  const SystemTree& tree = *tree_;
  switch (disk.kind) {
    case DiskKind::Emmc:
      return readEmmc(tree, disk.name);
    case DiskKind::Ufs:
      return readUfs(tree, disk.controller);
    case DiskKind::RawNand:
      return readRawNand(tree, disk.name);
    case DiskKind::Nvme: {
      HealthPage page = readHealthPage(root_, disk.controller);
      // In a recording the file's time says nothing.
      if (page.wear && clock_ && tree.isThisMachine()) {
        const auto now = static_cast<std::int64_t>(clock_->secondsSince1970());
        // A page of the future was read before the clock was set back: nobody knows how long ago.
        page.wear->ageSeconds = std::abs(now - page.readAt);
      }
      return page.wear;
    }
    case DiskKind::Other:
      return std::nullopt;
  }
  return std::nullopt;
}

std::string DiskReader::identity(const Disk& disk) const {
  constexpr std::size_t kLongest = 128;
  const std::string text = identityText(*tree_, disk);
  // Serial numbers may have blanks inside; those that are all blanks or zeros tell nothing.
  std::string plain;
  for (const char c : text) {
    if (c > ' ' && c < '\x7f') plain += c;
  }
  if (plain.find_first_not_of("0xX-") == std::string::npos || plain.size() > kLongest) return {};
  return std::string(diskKindName(disk.kind)) + " " + plain;
}

}  // namespace tally
