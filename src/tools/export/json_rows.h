// Rows as NDJSON: one object a line.
#pragma once

#include <string>

#include "tools/export/finite_numbers.h"
#include "tools/export/row_format.h"
#include "tools/frame/buffered_output.h"

namespace tally::tools {

// Writes what docs/schema/report-export-1.json describes.
class JsonRows final : public RowFormat {
 public:
  explicit JsonRows(BufferedOutput& output) : output_(output) {}
  void beginLog(const LogHead& head) override;
  void addScalar(std::string_view key, std::int64_t value) override;
  void addDistribution(std::string_view key, const ExportedDistribution& values) override;

 private:
  void appendHistogram(std::string& text, const std::vector<ExportedBucket>& histogram);

  BufferedOutput& output_;
  std::string front_;      // of every row of the log, up to its key
  std::string uppers_;     // of the histogram that is being written
  FiniteNumbers numbers_;  // of the row that is being written
};

}  // namespace tally::tools
