// Daily logs of any shape as tallyctl shows them: for people, for programs, and against each other.
#include <cstdio>
#include <cstdlib>
#include <nlohmann/json.hpp>

#include "base/utf8.h"
#include "fuzz_values.h"
#include "tools/report/log_diff.h"
#include "tools/report/log_view.h"

#ifndef FUZZ_REPLAY
// The tool's own is beside its command line, which the fuzzer's program does without.
void tally::tools::print(std::FILE* file, std::string_view text) {
  std::fwrite(text.data(), 1, text.size(), file);
}
#endif

using namespace tally;
using fuzz::require;

namespace {

// What is printed into a context: shown by a terminal, and never obeyed.
class Screen {
 public:
  Screen() : file_(::open_memstream(&text_, &size_)) { context.out = context.err = file_; }
  ~Screen() {
    std::fclose(file_);
    const std::string_view text(text_, size_);
    require(isValidUtf8(text), "what is shown is UTF-8");
    require(std::all_of(text.begin(), text.end(),
                        [](char c) {
                          return c == '\n' || (c & 0x60) != 0 || static_cast<signed char>(c) < 0;
                        }),
            "what is shown holds no control characters");
    std::free(text_);
  }
  Screen(const Screen&) = delete;
  Screen& operator=(const Screen&) = delete;

  tools::ToolContext context;

 private:
  char* text_ = nullptr;
  std::size_t size_ = 0;
  std::FILE* file_;
};

}  // namespace

FUZZ_TARGET(log_view)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto value = fuzz::valueOf(input);
  const auto* const document = kvCast<KvDictionary>(value.get());
  if (document == nullptr) return 0;
  const auto log = tools::DailyLog::of(document->copy());
  if (!log) return 0;
  // The same log without the first of its parts.
  auto shorter = document->copy();
  if (!shorter->empty()) shorter->remove(std::string(shorter->begin()->key->view()));
  const auto other = tools::DailyLog::of(shorter);

  Screen screen;
  // The log may say what its own keys mean.
  MetricTable table;
  for (const auto& entry : log->scalars()) {
    const std::string text(kvText(entry.value.get()));
    table.add({entry.key, std::nullopt, text, text, ""}, (entry.key->view().size() & 1) != 0);
  }
  table.finish();
  const tools::KnownMetrics metrics(std::move(table));
  tools::printDailyLog(screen.context, *log, document, metrics);
  for (const auto& entry : log->histograms()) {
    if (const auto* histogram = kvCast<KvDictionary>(entry.value.get())) {
      tools::printHistogram(screen.context, *histogram, 2);
    }
  }
  tools::jsonOf(*log, document, metrics)
      .dump(-1, ' ', false, tools::Json::error_handler_t::replace);
  if (other) {
    tools::printLogDiff(screen.context, *log, *other);
    tools::jsonOfLogDiff(*log, *other);
  }
  return 0;
}
