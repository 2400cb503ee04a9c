// Rows as CSV: a line of column names, then a line for each row.
#pragma once

#include <string>

#include "tools/export/finite_numbers.h"
#include "tools/export/row_format.h"
#include "tools/frame/buffered_output.h"

namespace tally::tools {

// The columns are the members of the NDJSON rows; one that a row lacks, or that is not known, is an
// empty field, and arrays are joined by ";". A text that a spreadsheet could take for a formula has
// an apostrophe in front.
class CsvRows final : public RowFormat {
 public:
  // For a person, texts are made safe to show.
  CsvRows(BufferedOutput& output, bool forPerson);
  void beginLog(const LogHead& head) override;
  void addScalar(std::string_view key, std::int64_t value) override;
  void addDistribution(std::string_view key, const ExportedDistribution& values) override;

 private:
  void appendText(std::string& out, std::string_view text) const;

  BufferedOutput& output_;
  const bool forPerson_;
  std::string front_;      // of every row of the log, up to its key
  FiniteNumbers numbers_;  // of the row that is being written
};

}  // namespace tally::tools
