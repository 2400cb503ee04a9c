// The figures of a log's own that come from reading its day.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/tables/own_metrics.h"
#include "report/log_values.h"

namespace tally {

class ReadFigures {
 public:
  explicit ReadFigures(OwnMetrics admitted)
      : admitted_(admitted), sumsRefusals_(admitted.has(OwnMetric::RefusedInAll)) {}

  const OwnMetrics& admitted() const { return admitted_; }

  // Takes every scalar of the day, whether it is reported or not.
  void note(std::string_view key, std::int64_t value) {
    if (!sumsRefusals_ || !key.starts_with(kRecorderKeys)) return;
    if (key == rowOf(OwnMetric::RecorderRan).key) recorderRan_ = true;
    if (key.starts_with(kRefusalKeys) && !isOwnMetric(key)) addRefusals(value);
  }
  // Once all is read.
  void record(LogValues& values) const;

  std::optional<std::uint64_t> damagedRows;

 private:
  static constexpr std::string_view kRecorderKeys = "vellum.tallyd.";
  void addRefusals(std::int64_t count);

  OwnMetrics admitted_;
  const bool sumsRefusals_;
  // Without refusals there are none only if the recorder was there to refuse.
  bool recorderRan_ = false;
  std::int64_t refusals_ = 0;
};

}  // namespace tally
