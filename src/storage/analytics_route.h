// Where the figures go on the days that belong to the analytics service.
#pragma once

#include <cstdint>
#include <functional>

#include "kv/value.h"

namespace tally {

// Sends the figures and returns what the caller gets instead of them. An empty route: there is no
// such service in this build; its days stay its days, and the caller gets null.
using AnalyticsRoute = std::function<KvRef<KvDictionary>(std::uint32_t options)>;

KvRef<KvDictionary> copyNandInfoWithRoute(std::uint32_t options, const AnalyticsRoute& route);

}  // namespace tally
