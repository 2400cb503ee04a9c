// Reads XML property lists.
#pragma once

#include <cstddef>
#include <string_view>

#include "base/result.h"
#include "kv/document_window.h"
#include "kv/plist_receiver.h"

namespace tally {

// True for documents that start with the byte order mark of UTF-16.
bool isUtf16Plist(std::string_view document);

// Reads a document in UTF-8. Accepts the property-list elements and nothing else; errors name the
// line. The window is then at the end of the document, whatever the result.
Status readXmlPlist(DocumentWindow& window, PlistReceiver& receiver);

// The same for a document in UTF-16, which may not be larger than maximumBytes as UTF-8. REQUIRES:
// it starts with its byte order mark.
Status readUtf16Plist(std::string_view document, std::size_t maximumBytes, PlistReceiver& receiver);

}  // namespace tally
