// The wear of a flash disk: one model for every kind. What a disk does not say is absent.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "base/time_text.h"

namespace tally {

enum class DiskKind : std::uint8_t { Emmc, Ufs, RawNand, Nvme, Other };

constexpr std::string_view diskKindName(DiskKind kind) {
  constexpr std::string_view kNames[] = {"eMMC", "UFS", "raw NAND", "NVMe", "other"};
  return kNames[static_cast<std::size_t>(kind)];
}

// What is known of a percentage: disks report it in whole percents or in steps of ten.
struct PercentRange {
  unsigned least = 0;
  std::optional<unsigned> most;  // none: it may be anything above
  bool operator==(const PercentRange&) const = default;
};

// A figure and the file or field that it was read from, in words that live as long as the program.
template <class T>
struct Reported {
  T value{};
  std::string_view origin;
  bool operator==(const Reported&) const = default;
};
template <class T>
using Figure = std::optional<Reported<T>>;

// Counts are those of the disk's life unless they say otherwise; larger ones than 64 bits hold stay
// at the largest.
struct Wear {
  Figure<PercentRange> used;      // of the rated life; of the main area where there are two
  Figure<PercentRange> fastUsed;  // the same of the fast, single-level area
  Figure<PercentRange> spare;     // what is left of the blocks that replace bad ones
  Figure<std::uint64_t> maximumErases, meanErases, totalErases;  // of blocks
  Figure<std::uint64_t> hostBytesRead, hostBytesWritten, flashBytesWritten;
  Figure<std::uint64_t> unsafeShutdowns, powerOnHours;
  Figure<std::uint64_t> mediaErrors;        // reads that could not be corrected
  Figure<std::uint64_t> mediaErrorsOfBoot;  // the same since the kernel started
  Figure<std::int64_t> temperature;         // in degrees Celsius
  Figure<std::uint64_t> warnings;           // bits, see kWearWarnings
  Figure<std::uint64_t> blocks, pagesPerBlock, bytesPerPage, badBlocks;
  std::optional<std::int64_t> ageSeconds;  // of the figures, where they are not of this moment

  // Of the area that is more worn.
  const Figure<PercentRange>& mostUsed() const {
    return !used || (fastUsed && fastUsed->value.least > used->value.least) ? fastUsed : used;
  }
  // Whether anything is known of how far it is worn.
  bool isKnown() const { return used || fastUsed || spare || maximumErases; }
};

// By bit.
constexpr std::string_view kWearWarnings[] = {
    "spare below its threshold",     "temperature out of range",
    "reliability degraded",          "read-only",
    "volatile memory backup failed", "persistent memory region unreliable"};

// Figures that are older do not speak for today.
constexpr std::int64_t kFreshSeconds = 2 * kSecondsPerDay;

}  // namespace tally
