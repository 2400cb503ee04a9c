// Examines a binary property list before the library reads it.
#pragma once

#include <cstddef>
#include <span>

#include "base/result.h"

namespace tally {

// True for documents that begin as binary property lists do.
bool isBinaryPlist(std::span<const std::byte> document);

// Succeeds when every object that the root reaches lies inside the document, has a type and width
// that values can carry, holds well-formed text, and is nested and repeated within the bounds of
// plist_codec.h. Time and memory stay bounded whatever the bytes are.
Status checkBinaryPlist(std::span<const std::byte> document);

}  // namespace tally
