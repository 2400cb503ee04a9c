// The whitelisted values of one day, on their way into the daily log.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "config/whitelist.h"
#include "config/whitelist_options.h"
#include "platform/metrics_store.h"
#include "platform/tables/own_metrics.h"
#include "report/distribution_pass.h"
#include "report/logged_distributions.h"
#include "report/logged_scalars.h"

namespace tally {

// What became of one key on its way into a log.
struct KeyTrace {
  std::string key;
  // The scalar as it was handed to the report, and each step of its rounding.
  std::optional<std::int64_t> scalarBefore;
  std::vector<RoundingStep> steps;
};

class LogValues {
 public:
  // Without a whitelist no key is admitted. The log and the trace, which may be null, must outlive
  // this object.
  LogValues(SystemLog& log, std::unique_ptr<Whitelist> whitelist, KeyTrace* trace)
      : whitelist_(std::move(whitelist)),
        trace_(trace),
        pass_(log, [this](std::string_view key, const DistributionResult& result) {
          distributions_.set(key, result);
        }) {}
  LogValues(const LogValues&) = delete;
  LogValues& operator=(const LogValues&) = delete;

  // Null: the key must not be reported.
  const ScalarOptions* scalarOptions(std::string_view key) const;
  const ScalarOptions* distributionOptions(std::string_view key) const;
  // The job's own figures that may be reported.
  OwnMetrics admittedOwn() const;
  // Whether distributionOptions() has an answer; nothing is logged.
  bool admitsDistribution(std::string_view key) const;

  // Records the value as its options round it.
  void addScalar(std::int64_t value, std::string_view key, const ScalarOptions& options);
  // Reads every sample; records the five statistics and, with "intervals", the histogram, at the
  // latest by finishDistributions().
  void addDistribution(DistributionValues& values, std::string_view key,
                       const ScalarOptions& options) {
    pass_.add(values, key, options);
  }
  void finishDistributions() { pass_.finish(); }
  bool empty() const { return scalars_.empty() && distributions_.empty(); }

  // Frees the whitelist, after which no key is admitted; returns the digest of its file, which is
  // empty without a whitelist.
  std::string releaseWhitelist();
  const LoggedScalars& scalars() const { return scalars_; }
  const LoggedDistributions& distributions() const { return distributions_; }

 private:
  std::unique_ptr<Whitelist> whitelist_;
  KeyTrace* trace_;
  DistributionPass pass_;
  LoggedScalars scalars_;
  LoggedDistributions distributions_;
};

}  // namespace tally
