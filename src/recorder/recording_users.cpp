#include "recorder/recording_users.h"

#include <algorithm>

namespace tally {
namespace {

// Traffic comes in bursts: what counts is the rate over this time.
constexpr double kSecondsAveraged = 600;

double largestAllowance(const RecorderSettings& settings) {
  return static_cast<double>(settings.number(RecorderNumber::MetricsPerSecond)) * kSecondsAveraged;
}

}  // namespace

std::uint32_t RecordingUsers::indexOf(Sender sender, const RecorderSettings& settings) {
  if (last_ < users_.size() && users_[last_].sender == sender) return last_;
  const auto found = std::ranges::find(users_, sender, &RecordingUser::sender);
  if (found == users_.end() && users_.size() < kMostUsers) {
    users_.push_back({.sender = sender, .allowance = largestAllowance(settings)});
    last_ = static_cast<std::uint32_t>(users_.size() - 1);
  } else if (found != users_.end()) {
    last_ = static_cast<std::uint32_t>(found - users_.begin());
  } else {
    last_ = kMostUsers - 1;
  }
  return last_;
}

bool RecordingUsers::admit(RecordingUser& user, std::size_t metrics, std::int64_t bootNanoseconds,
                           const RecorderSettings& settings) {
  if (user.allowanceAt != bootNanoseconds) {
    constexpr double kNanoseconds = 1e9;
    const double rate = static_cast<double>(settings.number(RecorderNumber::MetricsPerSecond));
    if (user.allowanceAt != 0) {
      const double seconds = static_cast<double>(bootNanoseconds - user.allowanceAt) / kNanoseconds;
      user.allowance += std::max(seconds, 0.0) * rate;
    }
    user.allowance = std::min(user.allowance, largestAllowance(settings));
    user.allowanceAt = bootNanoseconds;
  }
  const auto wanted = static_cast<double>(metrics);
  if (user.allowance < wanted) return false;
  user.allowance -= wanted;
  return true;
}

void RecordingUsers::beginDay() {
  for (RecordingUser& user : users_) user.keysToday = 0;
}

}  // namespace tally
