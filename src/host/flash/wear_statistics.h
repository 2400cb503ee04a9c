// The wear of a disk as the statistics buffer that storage drivers export.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "platform/flash/wear.h"
#include "platform/protocol/storage_protocol.h"

namespace tally {

// A figure of a kind of disk. The table of docs/linux.md is made from these.
struct WearStatistic {
  DiskKind kind;
  const ExportedStatistic& exported;
  std::string_view origin, unit;
  std::optional<std::uint64_t> (*value)(const Wear& wear);
};
std::span<const WearStatistic> wearStatistics();

// The statistics whose figures are known. Empty if there is none.
std::vector<std::byte> statisticsBuffer(DiskKind kind, const Wear& wear);

}  // namespace tally
