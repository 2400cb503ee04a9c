// What a log carries besides its keys, in words.
#pragma once

#include "tools/page/page_log.h"

namespace tally::tools {

// [name, value, meaning] each, of the document's and the submission's own fields.
Json pageFacts(const PageSources& sources, const PageLog& log);
// The rows of the activated applications, each a list of texts in the order of the columns
// "bundle", "version", "adamID", "arch", "uuid"; null when the log has no such list.
Json pageApplications(const DailyLog& log);

}  // namespace tally::tools
