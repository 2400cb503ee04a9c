// The metrics store of the device, in SQLite.
#pragma once

#include <memory>
#include <string>

#include "host/store/store_retention.h"
#include "host/store/store_schema.h"
#include "platform/clock.h"
#include "platform/metrics_store.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace tally {

// Nothing is opened before it is used. Failures are logged, the same one
// once. A checkpoint removes days while the store takes more than maximumBytes, and converts a
// store of the former format when the preferences say so (store_conversion_day.h); without any,
// never.
std::shared_ptr<MetricsStore> makeSqliteMetricsStore(StoreFile file, std::shared_ptr<SystemLog> log,
                                                     std::shared_ptr<const Clock> clock,
                                                     std::uint64_t maximumBytes = kMostStoreBytes,
                                                     std::shared_ptr<Preferences> preferences = {});

}  // namespace tally
