// Prints a daily log for people.
#pragma once

#include "tools/frame/output.h"
#include "tools/report/daily_log.h"

namespace tally::tools {

// Dates, tasking, whitelist digest and metadata, then scalars, distributions, histograms and
// applications, each as a table. options are those of the submission and may be null.
void printDailyLog(const ToolContext& context, const DailyLog& log, const KvDictionary* options);

// The buckets of one histogram as a table with bars, each line after so many blanks.
void printHistogram(const ToolContext& context, const KvDictionary& histogram, std::size_t indent);

// The document with derived figures: {"document", "options", "standardDeviations"}.
Json jsonOf(const DailyLog& log, const KvDictionary* options);

// A value on one line: strings as they are, numbers grouped, containers as their size.
std::string valueText(const KvObject* value);

}  // namespace tally::tools
