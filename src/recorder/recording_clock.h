// The day in which something is recorded, while the device's clock may be wrong.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>

namespace tally {

struct RecordingMoment {
  std::optional<std::int32_t> day;   // empty while the clock is not set
  std::int64_t secondOfDay = 0;      // with a day
  std::int64_t bootNanoseconds = 0;  // since boot, suspension included
  std::int64_t bootSeconds = 0;      // the same
  double wallMinusBoot = 0;          // what turns seconds since boot into seconds since 1970
};

// A clock is not set while it shows a day before the first device was made, or one before the
// newest day seen, on which the store already has data. The latter is believed nonetheless once the
// kernel says that the clock is synchronised, or when it has stayed so for a day: then it was the
// newest day that was wrong.
class RecordingClock {
 public:
  explicit RecordingClock(std::function<bool()> isSynchronised)
      : isSynchronised_(std::move(isSynchronised)) {}

  void setNewestDay(std::optional<std::int32_t> day) { newestDay_ = day; }
  RecordingMoment at(std::int64_t bootNanoseconds, double secondsSince1970);

 private:
  bool isBelieved(std::int32_t day, std::int64_t bootSeconds);

  std::function<bool()> isSynchronised_;
  std::optional<std::int32_t> newestDay_;
  std::optional<std::int64_t> behindSince_, askedAt_;
};

}  // namespace tally
