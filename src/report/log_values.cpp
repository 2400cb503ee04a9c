#include "report/log_values.h"

namespace tally {

const ScalarOptions* LogValues::scalarOptions(std::string_view key) const {
  return whitelist_ ? whitelist_->scalarOptions(key) : nullptr;
}

const ScalarOptions* LogValues::distributionOptions(std::string_view key) const {
  return whitelist_ ? whitelist_->distributionOptions(key) : nullptr;
}

OwnMetrics LogValues::admittedOwn() const {
  OwnMetrics admitted;
  for (std::size_t i = 0; whitelist_ && i < kOwnMetricCount; ++i) {
    // Being admitted is not enough: an internal device admits what nobody named.
    if (whitelist_->matchScalarKey(kOwnMetrics[i].key).entry != nullptr) {
      admitted.add(static_cast<OwnMetric>(i));
    }
  }
  return admitted;
}

bool LogValues::admitsDistribution(std::string_view key) const {
  return whitelist_ && whitelist_->matchDistributionKey(key).options != nullptr;
}

void LogValues::addScalar(std::int64_t value, std::string_view key, const ScalarOptions& options) {
  std::vector<RoundingStep>* steps = nullptr;
  if (trace_ != nullptr && trace_->key == key) {
    trace_->scalarBefore = value;
    trace_->steps.clear();
    steps = &trace_->steps;
  }
  scalars_.set(key, roundScalar(value, options, steps));
}

std::string LogValues::releaseWhitelist() {
  std::string digest = whitelist_ ? whitelist_->fileDigest() : std::string();
  whitelist_.reset();
  return digest;
}

}  // namespace tally
