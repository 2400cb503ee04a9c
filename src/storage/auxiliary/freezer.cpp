// Reads what the memory freezer wrote from a stackshot.
#include "storage/freezer.h"

#include "base/byte_reader.h"
#include "platform/platform.h"
#include "storage/kcdata.h"
#include "storage/nand_info/nand_info_failure.h"

namespace tally {
namespace {

constexpr char kSwapOutThread[] = "VM_swapout";
constexpr std::size_t kDiskWritesSizeOffset = 24;

}  // namespace

bool measureFreezerWrites(std::uint64_t* result) {
  const auto config = platform().stackshot->stackshotConfigCreate();
  if (config == nullptr) return false;
  if (config->stackshotConfigSetFlags(kStackshotFlagKcdata) != 0) return false;
  if (config->stackshotCapture() != 0) return false;
  const std::span<const std::byte> buffer = config->stackshotBuffer();
  if (buffer.data() == nullptr) return false;

  std::span<const std::byte> ioStats;
  if (getIOStatsWithThreadnameFromKCData(buffer.data(), buffer.data() + buffer.size(),
                                         kSwapOutThread, &ioStats) == 0) {
    return false;
  }
  if (ioStats.data() == nullptr) {
    *result = 0;
    return true;
  }
  // Statistics that end before the figure do not mean that it is 0.
  const auto written = ByteReader(ioStats).read<std::uint64_t>(kDiskWritesSizeOffset);
  if (!written) return false;
  *result = *written;
  return true;
}

KvRef<KvDictionary> CopyVMFreezerNANDInfo() {
  auto info = KvDictionary::create();
  std::uint64_t written = 0;
  if (measureFreezerWrites(&written)) {
    info->set(kNANDInfoVMFreezerNumPhysicalWritesKey,
              KvNumber::int64(static_cast<std::int64_t>(written)));
  } else {
    setFailure(*info, kNANDInfoVMFreezerErrorKey, kNANDInfoVMFreezerErrorMessageKey,
               "Unable parse snapshot for VMFreezer NAND writes.");
  }
  return info;
}

}  // namespace tally
