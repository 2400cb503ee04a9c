// Reads XML property lists into values.
#pragma once

#include <cstddef>
#include <string_view>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// True for documents that start with the byte order mark of UTF-16.
bool isUtf16Plist(std::string_view document);

// The root value of a document in UTF-8, or in UTF-16 with its byte order mark, which may be larger
// than maximumBytes neither as it is nor as UTF-8. Accepts the property-list elements and nothing
// else; errors name the line. REQUIRES: the document itself is not larger.
Result<KvRef<KvObject>> readXmlPlist(std::string_view document, std::size_t maximumBytes);

}  // namespace tally
