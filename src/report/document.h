// The log document: its parts, its encoding and its submission.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "kv/value.h"
#include "platform/platform.h"
#include "report/log_values.h"

namespace tally {

// The type and name of the daily log in log submission.
constexpr std::string_view kDailyLogTypeCode = "193";
constexpr std::string_view kDailyLogName = "log-tallyd";
// Enough for a million keys with long names and their histograms; the spool's bounds may allow
// less.
constexpr std::size_t kDailyLogMaximumBytes = 256u << 20;

// The languages and the region of the user.
KvRef<KvDictionary> makeMetadata(Locale& locale);

// Submits the log of a day; appInfo may be null. The whitelist of the values is released. A failure
// is logged.
void submitLog(Platform& platform, std::int32_t day, LogValues& values,
               const KvRef<KvDictionary>& metadata, const KvArray* appInfo);

}  // namespace tally
