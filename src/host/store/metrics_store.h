// The metrics store of the device, in SQLite.
#pragma once

#include <memory>
#include <string>

#include "host/store/store_retention.h"
#include "host/store/store_schema.h"
#include "platform/clock.h"
#include "platform/metrics_store.h"
#include "platform/system_log.h"

namespace tally {

// Nothing is opened before it is used. Failures are logged, the same one
// once. A checkpoint removes days while the store takes more than maximumBytes.
std::shared_ptr<MetricsStore> makeSqliteMetricsStore(StoreFile file, std::shared_ptr<SystemLog> log,
                                                     std::shared_ptr<const Clock> clock,
                                                     std::uint64_t maximumBytes = kMostStoreBytes);

}  // namespace tally
