// The words that a misspelt one may mean.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tally::tools {

// The known words that the text may mean, ignoring case and punctuation: at most so many, the
// nearest first, and none that is much further than the nearest.
std::vector<std::string_view> nearestWords(std::string_view text,
                                           std::span<const std::string_view> words,
                                           std::size_t most);
// The nearest word; empty if none is near.
std::optional<std::string_view> nearestWord(std::string_view text,
                                            std::span<const std::string_view> words);

// "; did you mean a, b or c?", or nothing for no words.
std::string suggestion(std::span<const std::string_view> words);
// "a, b or c".
std::string alternatives(std::span<const std::string_view> words);

}  // namespace tally::tools
