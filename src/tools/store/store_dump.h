// Prints rows of the metrics store.
#pragma once

#include <cstdint>
#include <cstdio>
#include <limits>
#include <string>

#include "platform/metrics_store.h"

namespace tally::tools {

struct DumpRange {
  std::string keyPrefix;
  // As in HistoryStore: after the minimum, up to the maximum.
  std::int32_t minimumDay = std::numeric_limits<std::int32_t>::min();
  std::int32_t maximumDay = std::numeric_limits<std::int32_t>::max();
};

// Writes scalars, then samples, by day and key. Stops when the file cannot be written; the error
// stays in the file.
// Memory does not grow with the rows. For a person, keys have their control characters escaped, so
// that what is printed cannot be imported where there are any.
void dumpAsCsv(HistoryStore& history, const DumpRange& range, std::FILE* out, bool forPerson);
// {"scalars": [{"key", "day", "value"}], "distributions": [{"key", "day", "samples": [[offset,
// value]]}]}; a sample that counts for more than one has its weight as a third number. A value that
// JSON cannot carry is the string "inf", "-inf" or "nan".
void dumpAsJson(HistoryStore& history, const DumpRange& range, std::FILE* out);

}  // namespace tally::tools
