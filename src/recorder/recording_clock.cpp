#include "recorder/recording_clock.h"

#include "base/time_text.h"
#include "platform/clock.h"

namespace tally {

RecordingMoment RecordingClock::at(std::int64_t bootNanoseconds, double secondsSince1970) {
  constexpr std::int64_t kNanoseconds = 1'000'000'000;
  RecordingMoment moment;
  moment.bootNanoseconds = bootNanoseconds;
  moment.bootSeconds = bootNanoseconds / kNanoseconds;
  moment.wallMinusBoot =
      secondsSince1970 - static_cast<double>(bootNanoseconds) / static_cast<double>(kNanoseconds);
  const std::int32_t day = dayOfSeconds(secondsSince1970);
  if (isBelieved(day, moment.bootSeconds)) {
    moment.day = day;
    moment.secondOfDay =
        static_cast<std::int64_t>(secondsSince1970 - static_cast<double>(day) * kSecondsPerDay);
    newestDay_ = day;
    behindSince_.reset();
  }
  return moment;
}

bool RecordingClock::isBelieved(std::int32_t day, std::int64_t bootSeconds) {
  if (day < kFirstPlausibleDay) return false;
  if (!newestDay_ || day >= *newestDay_) return true;
  if (!behindSince_) behindSince_ = bootSeconds;
  if (bootSeconds - *behindSince_ >= kSecondsPerDay) return true;
  constexpr std::int64_t kBetweenQuestions = 10;
  if (askedAt_ && bootSeconds - *askedAt_ < kBetweenQuestions) return false;
  askedAt_ = bootSeconds;
  return isSynchronised_();
}

}  // namespace tally
