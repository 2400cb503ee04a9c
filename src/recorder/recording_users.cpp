#include "recorder/recording_users.h"

#include <algorithm>
#include <iterator>

namespace tally {
namespace {

// Traffic comes in bursts: what counts is the rate over this time.
constexpr double kSecondsAveraged = 600;
// Durable keys are committed at once, but whoever sends them without a pause must not wear out the
// flash: each user has so many commits, and then one a second.
constexpr double kDurableCommits = 10;
constexpr double kNanoseconds = 1e9;

double largestAllowance(const RecorderSettings& settings) {
  return static_cast<double>(settings.number(RecorderNumber::MetricsPerSecond)) * kSecondsAveraged;
}

// Root, and those whom settings name: there are few, and they must not be taken for others.
bool hasRights(Sender sender, const RecorderSettings& settings) {
  return std::ranges::any_of(
      settings.allow, [&](const auto& row) { return row.second.numbers.contains(sender.user); });
}

}  // namespace

std::uint32_t RecordingUsers::indexOf(Sender sender, const RecorderSettings& settings) {
  if (last_ < users_.size() && users_[last_].sender == sender) return last_;
  auto found = std::ranges::find(users_, sender, &RecordingUser::sender);
  if (found == users_.end() && users_.size() >= kMostUsers && !hasRights(sender, settings)) {
    sender = {Sender::kOthers};
    found = std::ranges::find(users_, sender, &RecordingUser::sender);
  }
  if (found == users_.end()) {
    users_.push_back({.sender = sender, .allowance = largestAllowance(settings)});
    found = std::prev(users_.end());
  }
  return last_ = static_cast<std::uint32_t>(found - users_.begin());
}

bool RecordingUsers::admit(RecordingUser& user, std::size_t metrics, std::int64_t bootNanoseconds,
                           const RecorderSettings& settings) {
  if (user.allowanceAt != bootNanoseconds) {
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

std::int64_t RecordingUsers::durableDue(RecordingUser& user, std::int64_t bootNanoseconds) {
  if (user.durableWaits) return user.durableAt;
  const auto seconds = static_cast<double>(bootNanoseconds - user.durableAt) / kNanoseconds;
  const double commits = std::min(user.durableCommits + std::max(seconds, 0.0), kDurableCommits);
  const double wait = std::max(1 - commits, 0.0);
  user.durableWaits = true;
  user.durableCommits = commits + wait - 1;
  user.durableAt = bootNanoseconds + static_cast<std::int64_t>(wait * kNanoseconds);
  return user.durableAt;
}

void RecordingUsers::endDurable() {
  for (RecordingUser& user : users_) user.durableWaits = false;
}

void RecordingUsers::beginDay() {
  for (RecordingUser& user : users_) user.keysToday = 0;
}

}  // namespace tally
