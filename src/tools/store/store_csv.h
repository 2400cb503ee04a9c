// Rows of the metrics store as CSV: the form of `store dump` and `store import`.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tally::tools {

constexpr std::string_view kStoreCsvHeader = "kind,key,day,offset,value";
// Of a store in which samples count for more than one.
constexpr std::string_view kWeightedCsvHeader = "kind,key,day,offset,value,weight";

struct StoreRow {
  enum class Kind { None, Scalar, Distribution } kind = Kind::None;  // None: nothing to store
  std::string_view key;
  std::int32_t day = 0;
  std::int64_t scalar = 0;
  std::uint32_t offset = 0;  // of a sample, seconds into the day
  double sample = 0;
  std::uint32_t weight = 1;  // how many samples it stands for, 1 or more
};

class StoreCsvParser {
 public:
  // Reads one record without its line end. An empty record and the header are rows of the kind
  // None. Returns why the record is refused; empty when it is not. The key of the row is valid as
  // long as the record, and until the next call.
  std::string_view parse(std::string_view record, StoreRow& row);

 private:
  static constexpr std::size_t kFields = 6, kFieldsAtLeast = 5;  // the weight may be absent
  std::string_view split(std::string_view record);
  std::string_view readQuoted(std::string_view& rest, std::size_t field);

  std::array<std::string_view, kFields> fields_;
  std::array<std::string, kFields> unquoted_;
  std::string checkedKey_;  // the last key that was found valid: rows often repeat it
};

// The text as a field, in quotes where it must be.
std::string csvField(std::string_view text);
// Append a row; the field is csvField() of the key. A weighted row has the column of weights.
void appendScalarRow(std::string& out, std::string_view field, std::int32_t day, std::int64_t value,
                     bool weighted = false);
void appendSampleRow(std::string& out, std::string_view field, std::int32_t day,
                     std::uint32_t offset, double value,
                     std::optional<std::uint32_t> weight = std::nullopt);

}  // namespace tally::tools
