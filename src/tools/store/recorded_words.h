// What `store set` and `store push` are to record: keys and their values, as words.
#pragma once

#include <cstdio>
#include <string>
#include <vector>

#include "base/result.h"

namespace tally::tools {

struct RecordedWords {
  std::string key;
  std::vector<std::string> values;
};

enum class WordForm {
  Pairs,   // KEY VALUE [KEY VALUE]...
  Groups,  // KEY VALUE... [+ KEY VALUE...]...
};

// Every key has a value at least. The one word "-" stands for the lines of the input, each of the
// same form. An error says what is wrong, and in which line.
Result<std::vector<RecordedWords>> readRecordedWords(const std::vector<std::string>& words,
                                                     WordForm form, std::FILE* input);

}  // namespace tally::tools
