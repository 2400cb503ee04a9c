// The metrics store's day numbers as instants.
#include "platform/metrics_store.h"

namespace tally {

KvRef<KvDate> DayToDate(std::int32_t day) {
  constexpr double kSecondsPerDay = 86400.0;
  return KvDate::create(static_cast<double>(day) * kSecondsPerDay);
}

}  // namespace tally
