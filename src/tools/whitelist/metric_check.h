// What the metrics tables and the store say about a whitelist.
#pragma once

#include <vector>

#include "tools/metrics/known_metrics.h"
#include "tools/whitelist/whitelist_check.h"

namespace tally::tools {

// Entries that contradict the type of a metric or that no table knows; keys of the store that were
// recorded as two types or as another than the table's; boundaries in another unit than the samples
// of the store.
std::vector<Finding> checkMetrics(const ToolContext& context, const KnownMetrics& metrics,
                                  const WhitelistContent& whitelist);

}  // namespace tally::tools
