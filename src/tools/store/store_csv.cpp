#include "tools/store/store_csv.h"

#include <limits>

#include "base/number_text.h"
#include "base/time_text.h"
#include "host/store/store_schema.h"

namespace tally::tools {
namespace {

constexpr std::string_view kByteOrderMark = "\xef\xbb\xbf";

}  // namespace

// Takes a field in quotes, in which "" is a quote, from the front of the rest.
std::string_view StoreCsvParser::readQuoted(std::string_view& rest, std::size_t field) {
  std::string& text = unquoted_[field];
  text.clear();
  rest.remove_prefix(1);
  for (;;) {
    const std::size_t quote = rest.find('"');
    if (quote == std::string_view::npos) return "a quote is not closed";
    text.append(rest.substr(0, quote));
    rest.remove_prefix(quote + 1);
    if (!rest.starts_with('"')) break;
    text += '"';
    rest.remove_prefix(1);
  }
  fields_[field] = text;
  return rest.empty() || rest.starts_with(',') ? "" : "text follows a closing quote";
}

std::string_view StoreCsvParser::split(std::string_view record) {
  fields_.back() = {};
  for (std::size_t field = 0;; ++field) {
    if (field == kFields) return "more than six fields";
    if (record.starts_with('"')) {
      if (const auto fault = readQuoted(record, field); !fault.empty()) return fault;
    } else {
      fields_[field] = record.substr(0, record.find(','));
      record.remove_prefix(fields_[field].size());
    }
    if (record.empty()) return field + 1 < kFieldsAtLeast ? "fewer than five fields" : "";
    record.remove_prefix(1);
  }
}

std::string_view StoreCsvParser::parse(std::string_view record, StoreRow& row) {
  row = {};
  if (record.starts_with(kByteOrderMark)) record.remove_prefix(kByteOrderMark.size());
  if (record.empty() || record == kStoreCsvHeader || record == kWeightedCsvHeader) return "";
  if (const auto fault = split(record); !fault.empty()) return fault;
  const auto& [kind, key, day, offset, value, weight] = fields_;
  const bool isScalar = kind == "scalar";
  if (!isScalar && kind != "distribution") return "the kind is neither scalar nor distribution";
  if (key != checkedKey_ || key.empty()) {
    if (!isStoreKey(key)) return kStoreKeyRule;
    checkedKey_ = key;
  }
  const auto dayNumber = parseInt64(day);
  if (!dayNumber || *dayNumber != static_cast<std::int32_t>(*dayNumber)) {
    return "the day is not a whole number of 32 bits";
  }
  if (isScalar) {
    if (!offset.empty()) return "a scalar has no offset";
    if (!weight.empty()) return "a scalar has no weight";
    const auto number = parseInt64(value);
    if (!number) return "the value is not a whole number of 64 bits";
    row.scalar = *number;
  } else {
    const auto seconds = parseInt64(offset);
    if (!seconds || *seconds < 0 || *seconds >= kSecondsPerDay) {
      return "the offset is not a second of the day (0 to 86399)";
    }
    const auto number = parseDouble(value);
    if (!number) return "the value is not a number that a double can hold";
    const auto times = weight.empty() ? std::optional<std::int64_t>(1) : parseInt64(weight);
    if (!times || *times < 1 || *times > std::numeric_limits<std::uint32_t>::max()) {
      return "the weight is not a whole number from 1 to 4294967295";
    }
    row.weight = static_cast<std::uint32_t>(*times);
    row.offset = static_cast<std::uint32_t>(*seconds);
    row.sample = *number;
  }
  row.key = key;
  row.day = static_cast<std::int32_t>(*dayNumber);
  row.kind = isScalar ? StoreRow::Kind::Scalar : StoreRow::Kind::Distribution;
  return "";
}

std::string csvField(std::string_view text) {
  if (text.find_first_of(",\"\r\n") == std::string_view::npos) return std::string(text);
  std::string quoted = "\"";
  for (const char c : text) {
    if (c == '"') quoted += '"';
    quoted += c;
  }
  return quoted + '"';
}

void appendScalarRow(std::string& out, std::string_view field, std::int32_t day, std::int64_t value,
                     bool weighted) {
  out.append("scalar,").append(field) += ',';
  appendInt64(out, day);
  out += ",,";
  appendInt64(out, value);
  out += weighted ? ",\n" : "\n";
}

void appendSampleRow(std::string& out, std::string_view field, std::int32_t day,
                     std::uint32_t offset, double value, std::optional<std::uint32_t> weight) {
  out.append("distribution,").append(field) += ',';
  appendInt64(out, day);
  out += ',';
  appendUInt64(out, offset);
  out += ',';
  appendDouble(out, value);
  if (weight) {
    out += ',';
    appendUInt64(out, *weight);
  }
  out += '\n';
}

}  // namespace tally::tools
