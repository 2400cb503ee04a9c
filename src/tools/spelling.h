// Words that may be meant by a misspelt one.
#pragma once

#include <optional>
#include <span>
#include <string_view>

namespace tally::tools {

// The known word that is so near to the text, letter case and punctuation aside, that it may be
// meant; empty when none is.
std::optional<std::string_view> nearestWord(std::string_view text,
                                            std::span<const std::string_view> words);

}  // namespace tally::tools
