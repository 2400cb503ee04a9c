#include "tools/store/recorded_words.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string_view>

namespace tally::tools {
namespace {

// A million values. They are one transaction, and are read before it begins, so that others need
// not wait for a slow writer.
constexpr std::size_t kLongestInput = 16u << 20;
constexpr std::string_view kNextKey = "+";

// Empty unless something is wrong.
std::string append(const std::vector<std::string>& words, WordForm form,
                   std::vector<RecordedWords>& recorded) {
  bool expectsKey = true;
  for (const std::string& word : words) {
    if (expectsKey) {
      recorded.push_back({word, {}});
      expectsKey = false;
    } else if (form == WordForm::Groups && word == kNextKey && !recorded.back().values.empty()) {
      expectsKey = true;
    } else {
      recorded.back().values.push_back(word);
      expectsKey = form == WordForm::Pairs;
    }
  }
  if (expectsKey && form == WordForm::Groups) return "a key is missing";
  if (recorded.back().values.empty()) return "the key " + recorded.back().key + " has no value";
  return "";
}

std::vector<std::string> wordsOf(std::string_view line) {
  constexpr std::string_view kBlanks = " \t\r";
  std::vector<std::string> words;
  while (true) {
    line.remove_prefix(std::min(line.find_first_not_of(kBlanks), line.size()));
    if (line.empty()) return words;
    const auto end = std::min(line.find_first_of(kBlanks), line.size());
    words.emplace_back(line.substr(0, end));
    line.remove_prefix(end);
  }
}

Result<std::string> readAll(std::FILE* input) {
  std::string text(kLongestInput + 1, '\0');
  text.resize(std::fread(text.data(), 1, text.size(), input));
  if (std::ferror(input) != 0) {
    return Error{"cannot read standard input: " + std::string(std::strerror(errno))};
  }
  if (text.size() <= kLongestInput) return text;
  return Error{"standard input is longer than 16 MiB; store import takes any length"};
}

}  // namespace

Result<std::vector<RecordedWords>> readRecordedWords(const std::vector<std::string>& words,
                                                     WordForm form, std::FILE* input) {
  std::vector<RecordedWords> recorded;
  if (words.size() != 1 || words[0] != "-") {
    if (auto fault = append(words, form, recorded); !fault.empty()) return Error{fault};
    return recorded;
  }
  const auto text = readAll(input);
  if (!text) return text.error();
  std::string_view rest = *text;
  for (std::size_t line = 1; !rest.empty(); ++line) {
    const auto end = std::min(rest.find('\n'), rest.size());
    const auto found = wordsOf(rest.substr(0, end));
    rest.remove_prefix(std::min(end + 1, rest.size()));
    if (found.empty()) continue;
    if (auto fault = append(found, form, recorded); !fault.empty()) {
      return Error{"line " + std::to_string(line) + ": " + fault};
    }
  }
  return recorded;
}

}  // namespace tally::tools
