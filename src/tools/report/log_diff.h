// What is different between two daily logs.
#pragma once

#include <string>
#include <vector>

#include "tools/frame/output.h"
#include "tools/report/daily_log.h"

namespace tally::tools {

// A key that is only in one of two dictionaries, or whose values differ. The values are borrowed
// from the dictionaries; null where the key is missing.
struct Difference {
  std::string key;
  const KvObject* before = nullptr;
  const KvObject* after = nullptr;
};
// Ordered by key.
std::vector<Difference> differences(const KvDictionary& before, const KvDictionary& after);

void printLogDiff(const ToolContext& context, const DailyLog& before, const DailyLog& after);
// {"scalars", "distributions", "histograms", "metadata", "document"}, each {"added", "removed",
// "changed": {key: {"before", "after"}}}; changed scalars have a "delta" too. "document" is the
// rest.
Json jsonOfLogDiff(const DailyLog& before, const DailyLog& after);

}  // namespace tally::tools
