// The words that record values, on the command line and on lines of standard input.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "base/result.h"
#include "tools/record/recorder_client.h"

namespace tally::tools {

struct Record {
  enum class Kind { Set, Add, Push } kind;
  std::string key;
  std::int64_t whole = 0;       // for Set and Add
  std::vector<double> samples;  // for Push
};

// "set KEY VALUE [KEY VALUE]...", "add KEY [AMOUNT]" or "push KEY VALUE...". An error: a word is
// missing or wrong.
Result<std::vector<Record>> readRecords(const RecorderClient& client,
                                        std::span<const std::string> words);

// Puts them into the client's buffer.
Status record(RecorderClient& client, std::span<const Record> records);

std::size_t countValues(std::span<const Record> records);

}  // namespace tally::tools
