// The scalars that say how a log came about: the device's time, what was lost, what the job cost.
// None is measured or recorded unless the whitelist admits it.
#pragma once

#include <algorithm>
#include <bitset>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

namespace tally {

enum class OwnMetric : std::uint8_t {
  Synchronised,
  ClockSteps,
  Boots,
  Suspended,
  RecorderRan,
  RefusedInAll,
  DamagedRows,
  Cpu,
  PeakMemory,
  BytesWritten,
};

// Who finds it out, and of which time it is.
enum class OwnSource : std::uint8_t {
  Observations,  // by runs and by `tallyctl channels keep`, from a day's run to that of the next
  Recorder,      // during the day itself
  Report,        // while the day is read
  Run,           // of that day, which reported the day before
};

struct OwnMetricRow {
  std::string_view key;
  OwnSource source;
  std::string_view unit, meaning;
};

// In the order of the enumerators.
inline constexpr OwnMetricRow kOwnMetrics[] = {
    {"vellum.tallyrun.time.synchronised", OwnSource::Observations, "",
     "1: each observation found that the clock follows a reference; 0: some did not"},
    {"vellum.tallyrun.time.steps", OwnSource::Observations, "steps",
     "observations that found the clock set to another time since the one before, in the same "
     "boot"},
    {"vellum.tallyrun.time.boots", OwnSource::Observations, "boots",
     "boots that were observed and had not been before"},
    {"vellum.tallyrun.time.suspended", OwnSource::Observations, "seconds",
     "time that the machine was suspended"},
    {"vellum.tallyd.time.running", OwnSource::Recorder, "seconds",
     "time that the recorder ran, suspension included"},
    {"vellum.tallyd.refused.total", OwnSource::Report, "refusals",
     "what the recorder refused, for all reasons; absent if the recorder committed nothing"},
    {"vellum.tallyrun.loss.damaged_rows", OwnSource::Report, "rows",
     "rows of the day that were skipped since they are damaged"},
    {"vellum.tallyrun.cost.cpu", OwnSource::Run, "ms", "processor time of the day's last run"},
    {"vellum.tallyrun.cost.peak_memory", OwnSource::Run, "KiB",
     "most memory that the day's last run had resident"},
    {"vellum.tallyrun.cost.written", OwnSource::Run, "bytes",
     "what the day's last run had the kernel write to disks"},
};
inline constexpr std::size_t kOwnMetricCount = std::size(kOwnMetrics);
static_assert(kOwnMetricCount == std::size_t(OwnMetric::BytesWritten) + 1);

constexpr const OwnMetricRow& rowOf(OwnMetric metric) {
  return kOwnMetrics[static_cast<std::size_t>(metric)];
}
constexpr bool isOwnMetric(std::string_view key) {
  return std::ranges::find(kOwnMetrics, key, &OwnMetricRow::key) != std::end(kOwnMetrics);
}

// Of the keys that count refusals by their reason.
inline constexpr std::string_view kRefusalKeys = "vellum.tallyd.refused.";

// Those that a whitelist admits.
class OwnMetrics {
 public:
  void add(OwnMetric metric) { bits_.set(static_cast<std::size_t>(metric)); }
  bool has(OwnMetric metric) const { return bits_[static_cast<std::size_t>(metric)]; }
  bool empty() const { return bits_.none(); }

 private:
  std::bitset<kOwnMetricCount> bits_;
};

// The store keeps a row for each figure that is counted, whose day says when a run last wanted it.
// Whoever counts looks for the row: without one, or with an older one, nothing is counted.
constexpr bool isStillWanted(std::int64_t dayOfRow, std::int32_t today) {
  return dayOfRow == today || dayOfRow == std::int64_t{today} - 1;
}

}  // namespace tally
