// The report: one finished day of the metrics store as one daily log.
#pragma once

#include <cstdint>

#include "kv/value.h"
#include "platform/platform.h"
#include "platform/tables/own_metrics.h"
#include "report/log_values.h"

namespace tally {

// Loads the whitelist, reads the history of the day, measures the device, and submits the log.
// appInfo may be null, and so may the trace, which follows its key while the log is made. Nothing
// is measured or submitted when no key of the day is whitelisted. Failures are logged. Returns
// which of the job's own figures the whitelist admits.
OwnMetrics writeDailyLog(Platform& platform, std::int32_t day, const KvArray* appInfo,
                         KeyTrace* trace = nullptr);

}  // namespace tally
