#include "tools/record/record_lines.h"

#include <fmt/core.h>

#include <algorithm>
#include <string_view>

#include "base/process.h"
#include "base/text_lines.h"
#include "tools/record/record_words.h"

namespace tally::tools {
namespace {

constexpr int kStandardInput = 0;
constexpr std::size_t kLongestLine = 64u << 10, kPieceBytes = 64u << 10;
constexpr std::size_t kBadLinesKept = 20;

std::vector<std::string> wordsOf(std::string_view line) {
  std::vector<std::string> words;
  for (line = trimmed(line); !line.empty(); line = trimmed(line)) {
    const std::size_t end = std::min(line.find_first_of(" \t"), line.size());
    words.emplace_back(line.substr(0, end));
    line.remove_prefix(end);
  }
  return words;
}

class LineRecorder {
 public:
  LineRecorder(RecorderClient& client, RecordedLines& lines) : client_(client), lines_(lines) {}

  // Takes the next bytes of the input.
  Status take(std::string_view piece) {
    while (!piece.empty()) {
      const std::size_t end = piece.find('\n');
      const std::string_view part = piece.substr(0, end);
      // Of a line that is too long anyway, one byte too many is kept.
      begun_.append(part.substr(0, kLongestLine + 1 - begun_.size()));
      if (end == std::string_view::npos) break;
      piece.remove_prefix(end + 1);
      if (Status done = endLine(); !done) return done;
    }
    return Done{};
  }
  // Takes what was begun as a line.
  Status endLine() {
    ++number_;
    const std::string line = std::exchange(begun_, {});
    if (line.size() > kLongestLine) return reject("longer than 65,536 bytes");
    const auto words = wordsOf(line);
    if (words.empty()) return Done{};
    const auto records = readRecords(client_, words);
    if (!records) return reject(records.error().message);
    unsent_ += countValues(*records);
    return record(client_, *records);
  }
  Status deliver() {
    if (Status sent = client_.deliver(); !sent) return sent;
    lines_.values += std::exchange(unsent_, 0);
    return Done{};
  }
  bool hasBegunLine() const { return !begun_.empty(); }

 private:
  Status reject(std::string reason) {
    if (++lines_.rejected <= kBadLinesKept) {
      lines_.firstRejected.push_back({number_, std::move(reason)});
    }
    return Done{};
  }

  RecorderClient& client_;
  RecordedLines& lines_;
  std::string begun_;
  std::uint64_t number_ = 0, unsent_ = 0;
};

}  // namespace

Status recordStandardInput(RecorderClient& client, RecordedLines& lines) {
  LineRecorder recorder(client, lines);
  std::string piece(kPieceBytes, '\0');
  for (;;) {
    const auto count = readOnce(kStandardInput, piece);
    if (count < 0) return Error{"standard input cannot be read"};
    if (count == 0) break;
    const std::string_view bytes(piece.data(), static_cast<std::size_t>(count));
    if (Status taken = recorder.take(bytes); !taken) return taken;
    if (Status sent = recorder.deliver(); !sent) return sent;
  }
  if (recorder.hasBegunLine()) {
    if (Status taken = recorder.endLine(); !taken) return taken;
  }
  return recorder.deliver();
}

}  // namespace tally::tools
