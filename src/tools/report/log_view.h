// Prints a daily log for people.
#pragma once

#include "tools/frame/output.h"
#include "tools/metrics/known_metrics.h"
#include "tools/report/daily_log.h"

namespace tally::tools {

// Dates, tasking, whitelist digest and metadata, then scalars, distributions, histograms and
// applications, each as a table, with units and descriptions where they are known. options are
// those of the submission and may be null.
void printDailyLog(const ToolContext& context, const DailyLog& log, const KvDictionary* options,
                   const KnownMetrics& metrics);

// The buckets of one histogram as a table with bars, each line after so many blanks.
void printHistogram(const ToolContext& context, const KvDictionary& histogram, std::size_t indent);

// The document with derived figures: {"document", "options", "standardDeviations"}; and "metrics",
// {key: {"type", "unit", "description"}} for its keys of which something is known, if there are
// any.
Json jsonOf(const DailyLog& log, const KvDictionary* options, const KnownMetrics& metrics);

// A value on one line: strings as they are, numbers grouped, containers as their size.
std::string valueText(const KvObject* value);

}  // namespace tally::tools
