#include "tools/frame/spelling.h"

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

// Insertions, removals, replacements and swaps of neighbours from one text to the other.
std::size_t editDistance(std::string_view a, std::string_view b) {
  std::vector<std::size_t> former, last, row(b.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < a.size(); ++i) {
    former = std::exchange(last, row);
    row[0] = i + 1;
    for (std::size_t j = 0; j < b.size(); ++j) {
      row[j + 1] = std::min({last[j] + (a[i] == b[j] ? 0 : 1), last[j + 1] + 1, row[j] + 1});
      const bool swapped = i > 0 && j > 0 && a[i] == b[j - 1] && a[i - 1] == b[j];
      if (swapped) row[j + 1] = std::min(row[j + 1], former[j - 1] + 1);
    }
  }
  return row.back();
}

}  // namespace

std::vector<std::string_view> nearestWords(std::string_view text,
                                           std::span<const std::string_view> words,
                                           std::size_t most) {
  constexpr std::size_t kLongest = 128;  // a slip is not longer than what is known
  constexpr std::size_t kSpread = 1;     // slips that a word may be further than the nearest
  if (text.size() > kLongest) return {};
  const std::string wanted = letters(text);
  std::vector<std::pair<std::size_t, std::string_view>> near;
  for (const std::string_view word : words) {
    if (word.size() > 2 * kLongest) continue;
    const std::string known = letters(word);
    const std::size_t apart =
        std::max(wanted.size(), known.size()) - std::min(wanted.size(), known.size());
    if (apart * 3 > known.size()) continue;
    const std::size_t distance = editDistance(wanted, known);
    if (distance * 3 <= known.size()) near.emplace_back(distance, word);
  }
  std::ranges::stable_sort(near, {}, &std::pair<std::size_t, std::string_view>::first);
  std::vector<std::string_view> found;
  for (const auto& [distance, word] : near) {
    if (found.size() == most || distance > near.front().first + kSpread) break;
    found.push_back(word);
  }
  return found;
}

std::optional<std::string_view> nearestWord(std::string_view text,
                                            std::span<const std::string_view> words) {
  const auto nearest = nearestWords(text, words, 1);
  return nearest.empty() ? std::nullopt : std::optional(nearest.front());
}

std::string alternatives(std::span<const std::string_view> words) {
  std::string text;
  for (std::size_t i = 0; i < words.size(); ++i) {
    text.append(i == 0 ? "" : i + 1 < words.size() ? ", " : " or ").append(words[i]);
  }
  return text;
}

std::string suggestion(std::span<const std::string_view> words) {
  return words.empty() ? "" : "; did you mean " + alternatives(words) + "?";
}

}  // namespace tally::tools
