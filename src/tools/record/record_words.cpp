#include "tools/record/record_words.h"

#include <fmt/core.h>

#include <cmath>
#include <optional>

#include "base/number_text.h"

namespace tally::tools {
namespace {

using Records = Result<std::vector<Record>>;
using Words = std::span<const std::string>;

constexpr const char* kNotWhole = "{} is not a whole number of 64 bits";

Records readSet(Words words) {
  if (words.empty() || words.size() % 2 != 0) return Error{"keys and values come in pairs"};
  std::vector<Record> records;
  for (std::size_t i = 0; i < words.size(); i += 2) {
    const auto value = parseInt64(words[i + 1]);
    if (!value) return Error{fmt::format(kNotWhole, words[i + 1])};
    records.push_back({Record::Kind::Set, words[i], *value, {}});
  }
  return records;
}

Records readAdd(Words words) {
  if (words.empty() || words.size() > 2) return Error{"a key and at most one amount are needed"};
  const auto amount = words.size() == 2 ? parseInt64(words[1]) : std::optional<std::int64_t>(1);
  if (!amount) return Error{fmt::format(kNotWhole, words[1])};
  return std::vector{Record{Record::Kind::Add, words[0], *amount, {}}};
}

Records readPush(Words words) {
  if (words.size() < 2) return Error{"a key and at least one value are needed"};
  Record record{Record::Kind::Push, words[0], 0, {}};
  for (const std::string& word : words.subspan(1)) {
    const auto value = parseDouble(word);
    if (!value || !std::isfinite(*value)) {
      return Error{fmt::format("{} is not a finite number", word)};
    }
    record.samples.push_back(*value);
  }
  return std::vector{std::move(record)};
}

constexpr struct {
  const char* verb;
  Records (*read)(Words words);
} kVerbs[] = {{"set", readSet}, {"add", readAdd}, {"push", readPush}};

}  // namespace

Records readRecords(const RecorderClient& client, Words words) {
  for (const auto& [verb, read] : kVerbs) {
    if (words.empty() || words.front() != verb) continue;
    Records records = read(words.subspan(1));
    if (!records) return records;
    for (const Record& record : *records) {
      if (!client.accepts(record.key)) return Error{kMetricKeyRule};
    }
    return records;
  }
  return Error{"neither set, add nor push"};
}

Status record(RecorderClient& client, std::span<const Record> records) {
  for (const Record& record : records) {
    const Status done = record.kind == Record::Kind::Set ? client.set(record.key, record.whole)
                        : record.kind == Record::Kind::Add
                            ? client.add(record.key, record.whole)
                            : client.push(record.key, record.samples);
    if (!done) return done;
  }
  return Done{};
}

std::size_t countValues(std::span<const Record> records) {
  std::size_t count = 0;
  for (const Record& record : records) {
    count += record.kind == Record::Kind::Push ? record.samples.size() : 1;
  }
  return count;
}

}  // namespace tally::tools
