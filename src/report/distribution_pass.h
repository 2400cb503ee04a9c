// The summaries of many distributions.
#pragma once

#include <array>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "config/whitelist_options.h"
#include "platform/metrics_store.h"
#include "platform/system_log.h"
#include "report/distribution_summary.h"

namespace tally {

// Each sample's step waits for the division of the one before it, so that one distribution alone
// leaves the processor idle most of the time. The pass therefore keeps the samples of some
// distributions and works on these side by side; every figure has the bits that it has alone.
class DistributionPass {
 public:
  using Receiver = std::function<void(std::string_view key, const DistributionResult&)>;
  // Results come in the order of add(). The log must outlive the pass.
  DistributionPass(SystemLog& log, Receiver receiver) : log_(log), receiver_(std::move(receiver)) {}

  // Reads every sample. The options must outlive finish().
  void add(DistributionValues& values, std::string_view key, const ScalarOptions& options);
  // Delivers what is still kept.
  void finish() { deliver(); }

  static constexpr std::size_t kSideBySide = 8;
  // Of a distribution that is kept; one that has more is summarised at once, by itself.
  static constexpr std::size_t kMostKept = 16384;

 private:
  struct Kept {
    std::string key;
    std::unique_ptr<double[]> samples;  // kMostKept of capacity; reused
    std::size_t count = 0;
    std::optional<DistributionCounter> counter;
  };
  // False if it has too many samples to keep, or weights: these were summarised.
  static bool keep(Kept& kept, DistributionValues& values);
  void deliver();

  SystemLog& log_;
  Receiver receiver_;
  std::array<Kept, kSideBySide> kept_;
  std::size_t used_ = 0;
};

}  // namespace tally
