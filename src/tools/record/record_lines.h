// Values from the lines of standard input.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "base/result.h"
#include "tools/record/recorder_client.h"

namespace tally::tools {

struct RecordedLines {
  struct BadLine {
    std::uint64_t line;
    std::string reason;
  };
  std::uint64_t values = 0, rejected = 0;
  std::vector<BadLine> firstRejected;  // the first few
};

// Records the lines, in the form of readRecords() with blanks between words, until the input ends.
// What has been read is sent before more is waited for. Bad lines are kept in the result, good ones
// recorded. An error: the input failed or nothing could be sent; lines counts what was.
Status recordStandardInput(RecorderClient& client, RecordedLines& lines);

}  // namespace tally::tools
