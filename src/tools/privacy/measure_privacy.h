// Measures what a whitelist lets a device's reports reveal.
#pragma once

#include "tools/metrics/known_metrics.h"
#include "tools/privacy/exposure.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {

// Reads the whole store once. Memory grows with the keys, not with days or samples. Faults of the
// store are logged, and what can be read counts.
PrivacyReport measurePrivacy(const ToolContext& context, const WhitelistJudge& judge,
                             const KnownMetrics& metrics);

}  // namespace tally::tools
