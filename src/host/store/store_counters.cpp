#include "host/store/store_counters.h"

#include <limits>

namespace tally {
namespace {

// Far more than any machine has; a table beyond it was not written by this program.
constexpr std::size_t kMostCounters = 65536;

bool isInteger(const Statement& rows, int column) {
  return rows.type(column) == ColumnType::Integer;
}

std::optional<CounterState> stateOf(const Statement& rows) {
  CounterState state;
  state.key = rows.text(0);
  state.epoch = rows.text(1);
  if (!isStoreKey(state.key) || !isInteger(rows, 2) || !isInteger(rows, 3) || !isInteger(rows, 4)) {
    return std::nullopt;
  }
  const std::int64_t day = rows.integer(4);
  if (day < 0 || day > std::numeric_limits<std::int32_t>::max()) return std::nullopt;
  state.last = static_cast<std::uint64_t>(rows.integer(2));
  state.sum = static_cast<std::uint64_t>(rows.integer(3));
  state.day = static_cast<std::int32_t>(day);
  if (isInteger(rows, 5)) state.amount = rows.integer(5);
  return state;
}

}  // namespace

Result<std::vector<CounterState>> readCounterStates(const StoreFile& file) {
  std::vector<CounterState> states;
  auto store = openStoreForReading(file);
  if (!store) return store.error();
  if (!*store) return states;
  const auto kept = hasTable(**store, kCountersTable);
  if (!kept) return kept.error();
  if (!*kept) return states;
  auto rows = (*store)->prepare("SELECT key, epoch, last, sum, day, amount FROM counters");
  if (!rows) return rows.error();
  Step step = Step::Done;
  while (states.size() < kMostCounters && (step = rows->step()) == Step::Row) {
    if (auto state = stateOf(*rows)) states.push_back(*std::move(state));
  }
  if (step == Step::Failed) return (*store)->error();
  return states;
}

}  // namespace tally
