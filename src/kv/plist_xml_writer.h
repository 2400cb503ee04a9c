// Writes values as an XML property list, straight into a string.
#pragma once

#include <cstddef>
#include <string>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// The whole document. Fails when the value is nested too deeply (a cycle always is) or the document
// would be larger than maximumBytes.
Result<std::string> writeXmlPlist(const KvObject& root, std::size_t maximumBytes);

Error plistTooLarge(std::size_t maximumBytes);

}  // namespace tally
