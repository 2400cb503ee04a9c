// Shared by both snapshot layouts: their key, and numbers in columns.
#pragma once

#include <charconv>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <string_view>

namespace tally {

// The lines of C and S run together; readers of these texts rely on it.
constexpr std::string_view kSnapshotKey =
    "Key: \n"
    "T   - Timestamp\n"
    "E   - Erased bands during this time interval\n"
    "HR  - Host Reads (in 4k sectors)\n"
    "HW  - Host Writes (in 4k sectors)\n"
    "NR  - Nand Reads (in 4k sectors)\n"
    "NW  - Nand Writes (in 4k sectors)\n"
    "TH  - Time in Hysteresis in this time interval (in ms)\n"
    "GC  - Number of sectors (4k bytes) completed GC in this time interval\n"
    "W   - Number of wear level bands completed in this time interval\n"
    "BI  - Bands Intermediate (SLC) PendingErase\n"
    "BU  - Bands User (MLC) PendingErase\n"
    "V   - Number of Free Nodes\n"
    "BF  - Buffer Fragments/BufferHighWater\n"
    "P   - Percent of time in DoPreempt rather than DoNormal\n"
    "H   - Qos Delays: Normal/Extreme\n"
    "X   - Successful expedite commands/Failed expedite commands\n"
    "L   - Age of the oldest command in ms (calculated every second)/Qos Interval (in 100us "
    "units)\n"
    "C   - Command tags in use by host (Min/Max)S   - Number of free segs\n"
    "U   - Sectors of host unmaps\n"
    "RO  - Num read ops for this time interval: priority0/priority1/...\n"
    "RL  - Total Read Latency (in us) for this time interval: priority0/priority1/...\n"
    "RM  - Max Read Latency (int us) for this time interval: priority0/priority1/...\n"
    "WO  - Num write ops for this time interval: priority0/priority1/...\n"
    "WL  - Total write latency (in us) for this time interval: priority0/priority1/...\n"
    "WM  - Max write latency (in us) for this time interval: priority0/priority1/...\n"
    "\n";

// The three figures of each priority, in the order of the wire and of the columns.
struct PriorityFigure {
  char letter;
  unsigned width;  // of its column
};
constexpr PriorityFigure kPriorityFigures[] = {{'O', 4}, {'L', 7}, {'M', 5}};
constexpr std::size_t kValueBytes = 4;
constexpr std::size_t kPriorityBytes = 3 * kValueBytes;

constexpr std::size_t kLongestNumber = std::numeric_limits<std::uint32_t>::digits10 + 1;

constexpr unsigned digitCount(std::uint32_t value) {
  unsigned digits = 1;
  for (std::uint64_t next = 10; value >= next; next *= 10) ++digits;
  return digits;
}

// Writes the number at `to`, padded on its left to the width, and returns its end.
// REQUIRES: space for the width and for kLongestNumber bytes.
inline char* appendColumn(char* to, std::uint32_t value, unsigned width, char fill = ' ') {
  for (unsigned used = digitCount(value); used < width; ++used) *to++ = fill;
  return std::to_chars(to, to + kLongestNumber, value).ptr;
}

}  // namespace tally
