// A tallyd of its own for a benchmark.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <string_view>

namespace tally::bench {

// Ends the benchmark.
[[noreturn]] void giveUp(std::string_view reason);
inline void require(bool succeeded, std::string_view what) {
  if (!succeeded) giveUp(what);
}

// The user's limits would be reached within minutes.
inline constexpr std::string_view kNoLimits =
    "<key>MetricsPerSecond</key><integer>1000000000</integer>";

// Ends, and its root with it, when the object goes.
class Daemon {
 public:
  // Settings are rows of a property list's dictionary. A UDP port of 0: none.
  explicit Daemon(std::string_view settings = kNoLimits, int udpPort = 0);
  Daemon(const Daemon&) = delete;
  Daemon& operator=(const Daemon&) = delete;
  ~Daemon();

  pid_t process() const { return process_; }
  std::string socket() const { return root_ + "/run/tallyd/statsd.sock"; }
  const std::string& root() const { return root_; }
  // Waits until what is queued is in the store.
  void commit() const;
  // A number of its status.
  std::int64_t figure(std::string_view name) const;
  // How many metrics it has taken, once no more come.
  std::int64_t settledMetrics() const;
  // The sum of a scalar over all days of the store; 0 if there is none.
  std::int64_t stored(std::string_view key) const;

 private:
  std::string root_;
  pid_t process_ = -1;
};

}  // namespace tally::bench
