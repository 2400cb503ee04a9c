#include "tools/export/csv_rows.h"

#include "base/number_text.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "tools/store/store_csv.h"

namespace tally::tools {
namespace {

constexpr std::string_view kRowColumns =
    "schema,device,sequence,day,date,system_version,configuration,log_version,whitelist,key,kind,"
    "value,count,minimum,maximum,mean,squared_deviations,lower,upper,counts,not_finite\n";
// Of a scalar, after its value.
constexpr std::string_view kNoDistribution = ",,,,,,,,,\n";

// With an apostrophe in front where a spreadsheet would compute it; and in front of an apostrophe,
// so that the text can be restored. No reader agrees with another about zero bytes.
std::string harmless(std::string_view text) {
  constexpr std::string_view kStarts = "=+-@'\t\r\n";
  std::string out;
  if (!text.empty() && kStarts.find(text.front()) != std::string_view::npos) out += '\'';
  for (const char c : text) {
    if (c == '\0') {
      out += "\xEF\xBF\xBD";
    } else {
      out += c;
    }
  }
  return out;
}

bool isPlainField(std::string_view text) {
  bool plain = !text.empty() && ((text.front() >= 'a' && text.front() <= 'z') ||
                                 (text.front() >= '0' && text.front() <= '9'));
  for (const char c : text) plain &= c > ' ' && c < 0x7F && c != '"' && c != ',';
  return plain;
}

template <class Integer>
void appendField(std::string& out, std::optional<Integer> value) {
  if (value) appendInt64(out, static_cast<std::int64_t>(*value));
  out += ',';
}

void appendField(std::string& out, std::optional<double> value) {
  if (value) appendDouble(out, *value);
  out += ',';
}

template <class Items, class Append>
void appendJoined(std::string& out, const Items& items, const Append& append) {
  for (std::size_t i = 0; i < items.size(); ++i) {
    if (i != 0) out += ';';
    append(items[i], i);
  }
}

}  // namespace

CsvRows::CsvRows(BufferedOutput& output, bool forPerson) : output_(output), forPerson_(forPerson) {
  output_.text() += kRowColumns;
}

void CsvRows::appendText(std::string& out, std::string_view text) const {
  if (isPlainField(text)) {
    out += text;
  } else {
    const std::string safe = harmless(text);
    out += csvField(forPerson_ ? printable(safe) : safe);
  }
  out += ',';
}

void CsvRows::beginLog(const LogHead& head) {
  front_ = "1,";
  appendText(front_, head.origin.device);
  appendField(front_, head.origin.sequence);
  appendField(front_, head.day);
  appendText(front_, head.day ? dayText(*head.day) : "");
  appendText(front_, head.origin.systemVersion);
  appendText(front_, head.origin.configuration);
  appendField(front_, head.version);
  appendText(front_, head.whitelist);
}

void CsvRows::addScalar(std::string_view key, std::int64_t value) {
  std::string& text = output_.text();
  text += front_;
  appendText(text, key);
  text += "scalar,";
  appendInt64(text, value);
  text += kNoDistribution;
}

void CsvRows::addDistribution(std::string_view key, const ExportedDistribution& values) {
  std::string& text = output_.text();
  const auto& [statistics, histogram] = values;
  text += front_;
  appendText(text, key);
  text += "distribution,,";
  numbers_.clear();
  appendField(text, std::optional(statistics.count));
  appendField(text, numbers_.number("minimum", statistics.minimum));
  appendField(text, numbers_.number("maximum", statistics.maximum));
  appendField(text, numbers_.number("mean", statistics.mean));
  appendField(text, numbers_.number("squared_deviations", statistics.squaredDeviations));
  const auto appendBound = [&](std::optional<double> bound) {
    if (bound) appendDouble(text, *bound);
  };
  appendJoined(text, histogram, [&](const ExportedBucket& bucket, std::size_t i) {
    appendBound(numbers_.lower(bucket.bounds, i));
  });
  text += ',';
  appendJoined(text, histogram, [&](const ExportedBucket& bucket, std::size_t i) {
    appendBound(numbers_.upper(bucket.bounds, i));
  });
  text += ',';
  appendJoined(text, histogram,
               [&](const ExportedBucket& bucket, std::size_t) { appendInt64(text, bucket.count); });
  text += ',';
  appendJoined(text, numbers_.notes(), [&](const std::string& note, std::size_t) { text += note; });
  text += '\n';
}

}  // namespace tally::tools
