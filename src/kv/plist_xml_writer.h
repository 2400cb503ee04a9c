// Writes values as an XML property list, straight into a string.
#pragma once

#include <string>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// The whole document. Fails when the value is nested too deeply (a cycle always is) or the document
// would be too large to be read again.
Result<std::string> writeXmlPlist(const KvObject& root);

}  // namespace tally
