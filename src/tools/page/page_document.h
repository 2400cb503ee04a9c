// The HTML document around the logs.
#pragma once

#include <string>
#include <vector>

#include "tools/page/page_log.h"

namespace tally::tools {

// One self-contained file: it asks for nothing, and runs no script but its own.
std::string pageDocument(const PageSources& sources, const std::vector<PageLog>& logs);

}  // namespace tally::tools
