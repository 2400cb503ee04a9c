#include "tools/store/store_dump.h"

#include <cmath>
#include <string_view>

#include "base/number_text.h"
#include "base/printable.h"
#include "tools/frame/buffered_output.h"
#include "tools/frame/output.h"
#include "tools/store/store_csv.h"

namespace tally::tools {
namespace {

template <class Handler>
void eachSample(DistributionValues& values, const Handler& handler) {
  constexpr std::size_t kBatch = 1024;
  double batch[kBatch];
  std::uint32_t offsets[kBatch];
  while (const std::size_t count = values.nextValues(batch, offsets, kBatch)) {
    const auto weights = values.weights();
    for (std::size_t i = 0; i < count; ++i) {
      handler(offsets[i], batch[i], weights.empty() ? 1 : weights[i]);
    }
  }
}

}  // namespace

void dumpAsCsv(HistoryStore& history, const DumpRange& range, std::FILE* out, bool forPerson) {
  BufferedOutput output(out);
  const auto fieldOf = [forPerson](std::string_view key) {
    return csvField(forPerson ? printable(key) : std::string(key));
  };
  const bool weighted = history.hasWeights();
  output.text().append(weighted ? kWeightedCsvHeader : kStoreCsvHeader) += '\n';
  history.enumerateScalars(
      range.keyPrefix, range.minimumDay, range.maximumDay,
      [&](std::string_view key, std::int32_t day, std::int64_t value, bool& stop) {
        appendScalarRow(output.text(), fieldOf(key), day, value, weighted);
        stop = output.failed();
      });
  history.enumerateDistributions(
      range.keyPrefix, range.minimumDay, range.maximumDay,
      [&](std::string_view key, std::int32_t day, DistributionValues& values, bool& stop) {
        const std::string field = fieldOf(key);
        stop = output.failed();
        eachSample(values, [&](std::uint32_t offset, double value, std::uint32_t weight) {
          appendSampleRow(output.text(), field, day, offset, value,
                          weighted ? std::optional(weight) : std::nullopt);
        });
      });
}

void dumpAsJson(HistoryStore& history, const DumpRange& range, std::FILE* out) {
  BufferedOutput output(out);
  const auto beginRow = [&](const char* separator, std::string_view key, std::int32_t day) {
    std::string& text = output.text();
    text.append(separator).append("{\"key\": ").append(jsonText(key)).append(", \"day\": ");
    appendInt64(text, day);
  };
  output.text() += "{\"scalars\": [";
  const char* separator = "\n  ";
  history.enumerateScalars(
      range.keyPrefix, range.minimumDay, range.maximumDay,
      [&](std::string_view key, std::int32_t day, std::int64_t value, bool& stop) {
        stop = output.failed();
        beginRow(separator, key, day);
        separator = ",\n  ";
        output.text() += ", \"value\": ";
        appendInt64(output.text(), value);
        output.text() += '}';
      });
  output.text() += "],\n \"distributions\": [";
  separator = "\n  ";
  history.enumerateDistributions(
      range.keyPrefix, range.minimumDay, range.maximumDay,
      [&](std::string_view key, std::int32_t day, DistributionValues& values, bool& stop) {
        stop = output.failed();
        beginRow(separator, key, day);
        separator = ",\n  ";
        output.text() += ", \"samples\": [";
        const char* comma = "";
        eachSample(values, [&](std::uint32_t offset, double value, std::uint32_t weight) {
          std::string& text = output.text();
          text.append(comma) += '[';
          comma = ", ";
          appendUInt64(text, offset);
          text += ", ";
          const char* quote = std::isfinite(value) ? "" : "\"";
          text += quote;
          appendDouble(text, value);
          text += quote;
          if (weight != 1) {
            text += ", ";
            appendUInt64(text, weight);
          }
          text += ']';
        });
        output.text() += "]}";
      });
  output.text() += "]}\n";
}

}  // namespace tally::tools
