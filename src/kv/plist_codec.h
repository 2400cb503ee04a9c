// Property lists: XML and binary in, XML out.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "base/result.h"
#include "kv/document_window.h"
#include "kv/plist_receiver.h"
#include "kv/value.h"

namespace tally {

// Bounds on what is accepted: above what any real document needs, and low enough that a hostile one
// cannot exhaust the stack or the memory of a small device.
constexpr std::size_t kPlistMaximumBytes = 64u << 20;
constexpr std::size_t kPlistMaximumObjects = 4'000'000;

// The document's root value. An error says what is wrong; nothing partial is ever returned. A
// larger bound is for documents that the program wrote itself.
Result<KvRef<KvObject>> decodePlist(std::string_view document,
                                    std::size_t maximumBytes = kPlistMaximumBytes);

// The same part by part; of a document in UTF-8 the window shows little at once. REQUIRES: a source
// of the window ends before maximumBytes.
Status readPlist(DocumentWindow& window, PlistReceiver& receiver,
                 std::size_t maximumBytes = kPlistMaximumBytes);

// An XML property list, version 1.0, UTF-8, ending in a newline. Fails when the value is nested
// deeper than kMaximumDepth, which a reference cycle always is, or when the document would be
// larger than maximumBytes and so could not be read again. Characters that XML 1.0 cannot
// carry are written as U+FFFD. Reals read back equal.
Result<std::string> encodeXmlPlist(const KvObject& root,
                                   std::size_t maximumBytes = kPlistMaximumBytes);

// What is read again when the value is written as a part of an XML property list, `levels`
// containers below its root. Null when it cannot be written there at all.
KvRef<KvObject> storedForm(KvRef<KvObject> value, int levels = 1);

}  // namespace tally
