// Shows what a whitelist can reveal.
#pragma once

#include "tools/privacy/exposure.h"

namespace tally::tools {

Json jsonOf(const PrivacyReport& report);
// The entries that reveal most first, then remarks and coarser options.
void printPrivacy(const ToolContext& context, const PrivacyReport& report);

}  // namespace tally::tools
