// Which logs the page shows, and what must be said of each first.
#pragma once

#include <cstdint>
#include <vector>

#include "tools/page/page_log.h"

namespace tally::tools {

// The log that would go next, then the submitted daily logs of so many newest days, newest first.
// An error when the spool cannot be listed.
Result<std::vector<PageLog>> pageLogs(const PageSources& sources, std::uint32_t days);

}  // namespace tally::tools
