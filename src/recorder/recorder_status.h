// What the recorder says about itself.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "recorder/metric_intake.h"
#include "recorder/recording_clock.h"

namespace tally {

struct CommitFigures {
  std::int64_t startedAt = 0;  // of the recorder, nanoseconds since boot
  std::uint64_t started = 0, ended = 0, failed = 0;
  std::string failure;                // why the last one failed; empty when it succeeded
  std::optional<double> lastSuccess;  // seconds since 1970
};

// A property list.
std::string recorderStatusText(const MetricIntake& intake, const CommitFigures& commits,
                               const RecordingMoment& now);

}  // namespace tally
