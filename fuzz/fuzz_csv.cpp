// CSV for the metrics store: records out of a stream, rows out of records, and back.
#include <cmath>
#include <cstdio>
#include <memory>
#include <string>

#include "fuzz.h"
#include "tools/store/record_reader.h"
#include "tools/store/store_csv.h"

using namespace tally::tools;
using tally::fuzz::require;

namespace {

// The row as `store dump` writes it must read back as itself.
void checkRoundTrip(const StoreRow& row) {
  const std::string field = csvField(row.key);
  std::string line;
  if (row.kind == StoreRow::Kind::Scalar) {
    appendScalarRow(line, field, row.day, row.scalar, true);
  } else {
    appendSampleRow(line, field, row.day, row.offset, row.sample, row.weight);
  }
  require(line.ends_with('\n'), "a row ends its line");
  line.pop_back();
  StoreCsvParser parser;
  StoreRow again;
  require(parser.parse(line, again).empty(), "what is written is accepted");
  const bool sameSample =
      row.sample == again.sample || (std::isnan(row.sample) && std::isnan(again.sample));
  require(again.kind == row.kind && again.key == row.key && again.day == row.day &&
              again.scalar == row.scalar && again.offset == row.offset &&
              again.weight == row.weight && sameSample,
          "a row reads back as itself");
}

}  // namespace

FUZZ_TARGET(csv)(const std::uint8_t* data, std::size_t size) {
  tally::fuzz::Input input(data, size);
  std::string text(input.rest());
  if (text.empty()) return 0;
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(
      ::fmemopen(text.data(), text.size(), "r"), std::fclose);
  RecordReader reader(file.get());
  RecordReader::Record record;
  StoreCsvParser parser;
  std::uint64_t line = 0;
  while (reader.next(record)) {
    require(record.line > line, "every record has a line of its own");
    require(record.text.size() <= RecordReader::kLongestRecord, "records are bounded");
    line = record.line;
    StoreRow row;
    const std::string_view fault = parser.parse(record.text, row);
    if (!fault.empty() || row.kind == StoreRow::Kind::None) continue;
    checkRoundTrip(row);
  }
  require(reader.bytesTaken() == text.size(), "every byte is taken");
  return 0;
}
