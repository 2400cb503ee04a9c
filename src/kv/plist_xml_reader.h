// Reads XML property lists into values.
#pragma once

#include <string_view>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// The root value of a UTF-8 document. Its size must have been checked against kPlistMaximumBytes.
// Accepts the property-list elements and nothing else; errors name the line.
Result<KvRef<KvObject>> readXmlPlist(std::string_view document);

}  // namespace tally
