// The scalars of the daily sweep that are not channels.
#pragma once

#include <string_view>

namespace tally {

struct SweptMetric {
  std::string_view key, unit, meaning;
};

inline constexpr SweptMetric kDiskCapacity{"vellum.dockyard.DiskUsageUserTotalBlocks", "MiB",
                                           "capacity of the user's volume; -1: not known"},
    kDiskFree{"vellum.dockyard.DiskUsageUserBlocksFree", "MiB",
              "space that is free on the user's volume; -1: not known"};

// Of figures of the storage that are not known.
inline constexpr SweptMetric kStorageFigures{"vellum.NANDInfo.", "", "figure of the flash storage"};

}  // namespace tally
