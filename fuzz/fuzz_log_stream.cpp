// A stream of logs, cut into documents; and what such a log becomes in every format.
#include <cstdio>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>

#include "base/utf8.h"
#include "fuzz.h"
#include "tools/export/csv_rows.h"
#include "tools/export/exported_log.h"
#include "tools/export/json_rows.h"
#include "tools/export/log_stream.h"
#include "tools/export/metric_rows.h"

#ifndef FUZZ_REPLAY
// The tool's, without the rest of it.
void tally::tools::print(std::FILE* file, std::string_view text) {
  std::fwrite(text.data(), 1, text.size(), file);
}
#endif

using namespace tally::tools;
using tally::fuzz::require;

namespace {

using File = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;

// What the log becomes, after the text that the format begins with.
template <class Format, class... More>
std::string rowsOf(const DailyLog& log, More... more) {
  char* text = nullptr;
  std::size_t size = 0;
  {
    const File file(::open_memstream(&text, &size), std::fclose);
    BufferedOutput output(file.get());
    Format format(output, std::move(more)...);
    exportLog(log, {"device", 1, "1", "c"}, format);
    (void)format.finish();
  }
  std::string rows(text, size);
  std::free(text);
  require(tally::isValidUtf8(rows), "rows are UTF-8");
  return rows;
}

void checkRows(const DailyLog& log) {
  const std::string rows = rowsOf<JsonRows>(log);
  for (std::size_t at = 0; at < rows.size();) {
    const std::size_t end = rows.find('\n', at);
    require(end != rows.npos, "a row ends its line");
    const auto row = nlohmann::json::parse(rows.substr(at, end - at), nullptr, false);
    require(row.is_object(), "a row is JSON");
    require(!row.contains("lower") || (row["lower"].size() == row["counts"].size() &&
                                       row["upper"].size() == row["counts"].size()),
            "a histogram is whole");
    at = end + 1;
  }
  rowsOf<CsvRows>(log, true);
  require(rowsOf<MetricRows>(log, KnownMetrics({}), true, false).ends_with("# EOF\n"),
          "metrics have an end");
}

}  // namespace

FUZZ_TARGET(log_stream)(const std::uint8_t* data, std::size_t size) {
  constexpr std::size_t kLongest = 2048;
  tally::fuzz::Input input(data, size);
  std::string text(input.rest());
  if (text.empty()) return 0;
  const File file(::fmemopen(text.data(), text.size(), "r"), std::fclose);
  LogStream stream(file.get(), kLongest);
  std::size_t at = 0;
  while (const auto document = stream.next()) {
    if (!*document) continue;
    require(!(*document)->empty() && (*document)->size() <= kLongest, "documents are bounded");
    at = text.find(**document, at);
    require(at != text.npos, "documents are parts of the stream, in its order");
    at += (*document)->size();
    if (const auto log = DailyLog::parse(**document)) checkRows(*log);
  }
  return 0;
}
