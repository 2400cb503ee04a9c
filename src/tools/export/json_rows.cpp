#include "tools/export/json_rows.h"

#include <cmath>

#include "base/number_text.h"
#include "base/time_text.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

// Most texts are keys that need no escape.
void appendJsonText(std::string& out, std::string_view text) {
  bool plain = true;
  for (const char c : text) plain &= c >= ' ' && c < 0x7F && c != '"' && c != '\\';
  if (!plain) {
    out += jsonText(text);
    return;
  }
  out += '"';
  out.append(text) += '"';
}

void appendJsonTextOrNull(std::string& out, std::string_view text) {
  if (text.empty()) {
    out += "null";
  } else {
    appendJsonText(out, text);
  }
}

template <class Integer>
void appendIntegerOrNull(std::string& out, std::optional<Integer> value) {
  if (value) {
    appendInt64(out, static_cast<std::int64_t>(*value));
  } else {
    out += "null";
  }
}

void appendNumberOrNull(std::string& out, std::optional<double> value) {
  if (value) {
    appendDouble(out, *value);
  } else {
    out += "null";
  }
}

template <class Items, class Append>
void appendArray(std::string& out, const Items& items, const Append& append) {
  out += '[';
  for (std::size_t i = 0; i < items.size(); ++i) {
    if (i != 0) out += ',';
    append(items[i], i);
  }
  out += ']';
}

}  // namespace

void JsonRows::beginLog(const LogHead& head) {
  front_ = R"({"schema":1,"device":)";
  appendJsonTextOrNull(front_, head.origin.device);
  front_ += R"(,"sequence":)";
  appendIntegerOrNull(front_, head.origin.sequence);
  front_ += R"(,"day":)";
  appendIntegerOrNull(front_, head.day);
  front_ += R"(,"date":)";
  appendJsonTextOrNull(front_, head.day ? dayText(*head.day) : "");
  front_ += R"(,"system_version":)";
  appendJsonTextOrNull(front_, head.origin.systemVersion);
  front_ += R"(,"configuration":)";
  appendJsonTextOrNull(front_, head.origin.configuration);
  front_ += R"(,"log_version":)";
  appendIntegerOrNull(front_, head.version);
  front_ += R"(,"whitelist":)";
  appendJsonTextOrNull(front_, head.whitelist);
  front_ += R"(,"key":)";
}

void JsonRows::addScalar(std::string_view key, std::int64_t value) {
  std::string& text = output_.text();
  text += front_;
  appendJsonText(text, key);
  text += R"(,"kind":"scalar","value":")";
  appendInt64(text, value);
  text += "\"}\n";
}

void JsonRows::addDistribution(std::string_view key, const ExportedDistribution& values) {
  std::string& text = output_.text();
  const Statistics& statistics = values.statistics;
  text += front_;
  appendJsonText(text, key);
  text += R"(,"kind":"distribution","count":)";
  appendInt64(text, statistics.count);
  numbers_.clear();
  text += R"(,"minimum":)";
  appendNumberOrNull(text, numbers_.number("minimum", statistics.minimum));
  text += R"(,"maximum":)";
  appendNumberOrNull(text, numbers_.number("maximum", statistics.maximum));
  text += R"(,"mean":)";
  appendNumberOrNull(text, numbers_.number("mean", statistics.mean));
  text += R"(,"squared_deviations":)";
  appendNumberOrNull(text, numbers_.number("squared_deviations", statistics.squaredDeviations));
  if (!values.histogram.empty()) appendHistogram(text, values.histogram);
  if (!numbers_.notes().empty()) {
    text += R"(,"not_finite":)";
    appendArray(text, numbers_.notes(),
                [&](const std::string& note, std::size_t) { appendJsonText(text, note); });
  }
  text += "}\n";
}

void JsonRows::appendHistogram(std::string& text, const std::vector<ExportedBucket>& histogram) {
  uppers_.clear();
  std::size_t former = 0;  // where the upper bound of the former bucket begins
  text += R"(,"lower":)";
  appendArray(text, histogram, [&](const ExportedBucket& bucket, std::size_t i) {
    // A bucket mostly begins where the former one ends, whose bound is text already.
    const bool isNext = i != 0 && bucket.bounds.lower == histogram[i - 1].bounds.upper;
    if (isNext && std::isfinite(bucket.bounds.lower)) {
      text.append(uppers_, former);
    } else {
      appendNumberOrNull(text, numbers_.lower(bucket.bounds, i));
    }
    if (i != 0) uppers_ += ',';
    former = uppers_.size();
    appendNumberOrNull(uppers_, numbers_.upper(bucket.bounds, i));
  });
  text.append(R"(,"upper":[)").append(uppers_) += ']';
  text += R"(,"counts":)";
  appendArray(text, histogram,
              [&](const ExportedBucket& bucket, std::size_t) { appendInt64(text, bucket.count); });
}

}  // namespace tally::tools
