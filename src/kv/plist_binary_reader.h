// Reads binary property lists into values.
#pragma once

#include <string_view>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// True for documents that start as binary property lists do.
bool isBinaryPlist(std::string_view document);

// The root value. Every object that the root reaches must lie inside the document, have a type and
// width that values can carry, contain well-formed text, and be nested and repeated within the
// bounds of plist_codec.h. Time and memory stay bounded whatever the bytes are.
Result<KvRef<KvObject>> readBinaryPlist(std::string_view document);

}  // namespace tally
