// The values of an XML property list that hold no other: text to value, strictly.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Character data with its references (the five predefined ones and code points) put in. Line ends
// become newlines. Empty when a reference is unknown, unfinished or names no character.
std::optional<std::string> unescapeXml(std::string_view text);

// Each is null when the text is not wholly a value of the type. Blanks around it are skipped.
KvRef<KvNumber> integerFromText(std::string_view text);  // int64, or uint64 when it needs to be
KvRef<KvNumber> realFromText(std::string_view text);
KvRef<KvDate> dateFromText(std::string_view text);  // 2026-03-01T12:30:00Z
KvRef<KvData> dataFromText(std::string_view text);

}  // namespace tally
