// The metrics store of the device, in SQLite.
#pragma once

#include <memory>
#include <string>

#include "platform/clock.h"
#include "platform/metrics_store.h"
#include "platform/system_log.h"

namespace tally {

// The store at the path. Nothing is opened before it is used. Failures are logged, the same one
// once.
std::shared_ptr<MetricsStore> makeSqliteMetricsStore(std::string path,
                                                     std::shared_ptr<SystemLog> log,
                                                     std::shared_ptr<const Clock> clock);

}  // namespace tally
