// Base64, the text form of binary data in XML property lists.
#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tally {

void appendBase64(std::string& out, std::span<const std::byte> bytes);
// White space is skipped; padding may be left out. Empty when the text is anything else.
std::optional<std::vector<std::byte>> decodeBase64(std::string_view text);

}  // namespace tally
