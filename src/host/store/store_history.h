// Reads the metrics store.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "host/store/store_schema.h"
#include "platform/metrics_store.h"

namespace tally {

// Told, in words that name the store, why rows are missing from what was read.
using StoreFaultHandler = std::function<void(const std::string& message)>;

// Told of each damaged row that is left out. A key that is damaged itself may be any bytes.
using DamagedRowHandler = std::function<void(std::string_view key, std::int64_t day)>;

// The rows that the store has at this moment; none, without a fault, when there is no
// store. Samples are read row by row, so memory does not grow with their number. A damaged row
// is left out. Each enumeration reports at most one fault. Never null.
std::unique_ptr<HistoryStore> openSqliteHistory(const StoreFile& file, StoreFaultHandler onFault,
                                                DamagedRowHandler onDamaged = {});

struct StoreKey {
  enum class Kind { Scalar, Distribution } kind = Kind::Scalar;
  std::string_view key;
  std::int64_t firstDay = 0, lastDay = 0, days = 0;
  std::int64_t samples = 0;  // of a distribution
};
// Calls the handler for every key, scalars first, each kind ordered by key.
void listStoreKeys(const StoreFile& file, const std::function<void(const StoreKey&)>& handler,
                   const StoreFaultHandler& onFault);

}  // namespace tally
