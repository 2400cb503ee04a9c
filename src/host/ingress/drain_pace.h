// When a socket of datagrams is emptied again.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>

namespace tally {

// While many datagrams come, waking up costs more than reading them. A socket whose queue has space
// for what comes meanwhile is then left alone for a moment, so that one call reads a batch.
class DrainPace {
 public:
  static constexpr int kDeepQueue = 512;  // what a queue must hold for that

  // After a call at this time (in nanoseconds) that read so many and left the queue empty: for how
  // long nothing is to be read. 0: to be read as soon as something comes.
  std::int64_t pauseAfter(std::size_t count, std::int64_t now) {
    constexpr std::int64_t kLongest = 1'000'000;
    constexpr std::int64_t kBatch = 64;  // an eighth of the queue: the rate may rise
    constexpr std::int64_t kWorthIt = 8;
    const std::int64_t interval = std::clamp<std::int64_t>(now - last_, 1, 1'000'000'000);
    last_ = now;
    const auto arrived = static_cast<std::int64_t>(count);
    if (arrived * kLongest / interval < kWorthIt) return 0;
    return std::min(kLongest, kBatch * interval / arrived);
  }

 private:
  std::int64_t last_ = 0;
};

}  // namespace tally
