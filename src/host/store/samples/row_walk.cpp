#include "host/store/samples/row_walk.h"

#include <fmt/format.h>

namespace tally {

bool prepareOrFail(Database& database, StoreFaults& faults, Statement& statement,
                   const std::string& text) {
  auto prepared = database.prepare(text);
  if (prepared) {
    statement = std::move(*prepared);
  } else {
    faults.fail(prepared.error());
  }
  return static_cast<bool>(prepared);
}

bool RowWalk::open(std::string_view table, std::string_view columns, std::string_view blob,
                   const StoreRange& range, bool filtered) {
  const std::string wanted =
      filtered ? fmt::format("iif({}(key), {}, NULL)", kWantedFunction, blob) : std::string(blob);
  if (!prepareOrFail(
          database_, faults_, rows_,
          fmt::format("SELECT day, key, number, {}, {} FROM {}{} ORDER BY day, key, number", wanted,
                      columns, table, StoreRange::kCondition))) {
    return false;
  }
  range.bindTo(rows_);
  return true;
}

}  // namespace tally
