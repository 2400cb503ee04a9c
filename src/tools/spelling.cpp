#include "tools/spelling.h"

#include <algorithm>
#include <cctype>
#include <numeric>
#include <string>
#include <utility>
#include <vector>

namespace tally::tools {
namespace {

std::string letters(std::string_view text) {
  std::string result;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (std::isalnum(byte) != 0) result += static_cast<char>(std::tolower(byte));
  }
  return result;
}

// Insertions, removals and replacements from one text to the other.
std::size_t editDistance(std::string_view a, std::string_view b) {
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < a.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i + 1);
    for (std::size_t j = 0; j < b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i] == b[j] ? 0 : 1);
      diagonal = std::exchange(row[j + 1], std::min({row[j], row[j + 1]}) + 1);
      row[j + 1] = std::min(row[j + 1], replaced);
    }
  }
  return row.back();
}

}  // namespace

std::optional<std::string_view> nearestWord(std::string_view text,
                                            std::span<const std::string_view> words) {
  constexpr std::size_t kLongest = 64;  // longer than any word that is known, and a slip of it
  if (text.size() > kLongest) return std::nullopt;
  const std::string wanted = letters(text);
  std::optional<std::string_view> nearest;
  std::size_t least = 0;
  for (const std::string_view word : words) {
    const std::string known = letters(word);
    const std::size_t distance = editDistance(wanted, known);
    if (distance * 3 > known.size()) continue;
    if (!nearest || distance < least) {
      nearest = word;
      least = distance;
    }
  }
  return nearest;
}

}  // namespace tally::tools
