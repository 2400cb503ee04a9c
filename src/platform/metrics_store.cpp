// The metrics store's day numbers as instants.
#include "platform/metrics_store.h"

#include "base/time_text.h"

namespace tally {

KvRef<KvDate> DayToDate(std::int32_t day) {
  return KvDate::create(static_cast<double>(day) * kSecondsPerDay);
}

}  // namespace tally
