// The users who record, and what each may do.
#pragma once

#include <cstdint>
#include <vector>

#include "platform/recording/ingress.h"
#include "recorder/recorder_settings.h"
#include "recorder/refusal.h"

namespace tally {

struct RecordingUser {
  Sender sender;
  double allowance = 0;          // metrics that the user may still send
  std::int64_t allowanceAt = 0;  // nanoseconds since boot
  std::uint64_t metrics = 0;     // recorded since the start
  std::uint64_t keysToday = 0;
  std::size_t bytes = 0;  // of memory that the user's samples take
  RefusalCounts refused{};
  double durableCommits = 0;   // that the user's durable keys may begin at once
  std::int64_t durableAt = 0;  // as of when, nanoseconds since boot
  bool durableWaits = false;
};

class RecordingUsers {
 public:
  // Their number is bounded, since one may have thousands of users: those above are one together.
  static constexpr std::size_t kMostUsers = 1024;

  // An index, valid for the life of the object.
  std::uint32_t indexOf(Sender sender, const RecorderSettings& settings);
  RecordingUser& at(std::uint32_t index) { return users_[index]; }
  const std::vector<RecordingUser>& all() const { return users_; }

  // Whether the user may send so many metrics now, which then count.
  bool admit(RecordingUser& user, std::size_t metrics, std::int64_t bootNanoseconds,
             const RecorderSettings& settings);
  // When a durable key that the user records now is to be committed.
  std::int64_t durableDue(RecordingUser& user, std::int64_t bootNanoseconds);
  // Those keys are being committed.
  void endDurable();
  void beginDay();

 private:
  std::vector<RecordingUser> users_;
  std::uint32_t last_ = 0;
};

}  // namespace tally
