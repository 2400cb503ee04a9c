#include "recorder/statsd_line.h"

#include <charconv>
#include <cmath>
#include <cstring>
#include <system_error>

namespace tally {
namespace {

// So many digits fit into 64 bits, whatever they are.
constexpr std::size_t kSafeDigits = 18;

std::size_t findIn(std::string_view text, char wanted) {
  const void* const found = text.empty() ? nullptr : std::memchr(text.data(), wanted, text.size());
  return found == nullptr ? std::string_view::npos
                          : static_cast<std::size_t>(static_cast<const char*>(found) - text.data());
}

// The text up to the separator, which is removed with it; all of it when there is none.
std::string_view takeUpTo(std::string_view& text, char separator) {
  const std::size_t end = findIn(text, separator);
  const std::string_view taken = text.substr(0, end);
  text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  return taken;
}

// Whether a decimal number that no double can hold is too small for it.
bool isBelowOne(std::string_view text) {
  const std::size_t exponent = text.find_first_of("eE");
  if (exponent != std::string_view::npos) return text.substr(exponent + 1).starts_with('-');
  return text.substr(0, text.find('.')).find_first_not_of('0') == std::string_view::npos;
}

// The text as a whole number; empty if it has anything but digits, or too many.
std::optional<std::int64_t> parseDigits(std::string_view text) {
  std::int64_t whole = 0;
  if (text.size() <= kSafeDigits) {
    for (const char digit : text) {
      if (digit < '0' || digit > '9') return std::nullopt;
      whole = whole * 10 + (digit - '0');
    }
    return whole;
  }
  const char* const end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, whole);
  return stopped == end && error == std::errc() ? std::optional(whole) : std::nullopt;
}

// Decimal, with an exponent or without; "1." and ".5" are numbers, "inf" and blanks are not.
bool parseNumber(std::string_view text, MetricValue& value) {
  value.isSigned = !text.empty() && (text.front() == '-' || text.front() == '+');
  const bool negative = value.isSigned && text.front() == '-';
  if (value.isSigned) text.remove_prefix(1);
  if (text.empty() || (text.front() != '.' && (text.front() < '0' || text.front() > '9'))) {
    return false;
  }
  value.whole = parseDigits(text);
  if (value.whole) {
    value.number = static_cast<double>(*value.whole);
    if (negative) {
      value.number = -value.number;
      value.whole = -*value.whole;
    }
    return true;
  }
  double number = 0;
  const char* const end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, number);
  if (stopped != end || error == std::errc::invalid_argument) return false;
  // What is too small for a double is as good as 0; what is too large has no meaning.
  if (error == std::errc::result_out_of_range) {
    if (!isBelowOne(text)) return false;
    number = 0;
  }
  if (!std::isfinite(number)) return false;
  value.number = negative ? -number : number;
  return true;
}

std::optional<Refusal> typeOf(std::string_view text, LineType& type) {
  if (text == "ms") {
    type = LineType::Duration;
    return std::nullopt;
  }
  if (text.size() != 1) return text.empty() ? Refusal::Malformed : Refusal::Type;
  switch (text.front()) {
    case 'c':
      type = LineType::Counter;
      return std::nullopt;
    case 'g':
      type = LineType::Gauge;
      return std::nullopt;
    case 'h':
    case 'd':
      type = LineType::Sample;
      return std::nullopt;
    case 's':
      return Refusal::Set;
    default:
      return Refusal::Type;
  }
}

bool isKnownUnused(std::string_view section) {
  return section.starts_with("c:") || section.starts_with("e:") || section.starts_with("card:") ||
         section.front() == 'T';
}

std::optional<Refusal> readSections(std::string_view text, MetricLine& metric) {
  while (!text.empty()) {
    const std::string_view section = takeUpTo(text, '|');
    if (section.empty()) continue;
    if (section.front() == '@') {
      MetricValue rate;
      if (!parseNumber(section.substr(1), rate) || !(rate.number > 0 && rate.number <= 1)) {
        return Refusal::SampleRate;
      }
      metric.rate =
          metric.type == LineType::Gauge ? 1 : rate.number;  // a sampled gauge is the gauge
    } else if (section.front() == '#') {
      metric.tags = section.substr(1);
    } else if (!isKnownUnused(section)) {
      ++metric.skippedSections;
    }
  }
  return std::nullopt;
}

std::optional<Refusal> readValues(std::string_view text, LineType type,
                                  std::vector<MetricValue>& values) {
  values.clear();
  while (!text.empty()) {
    const std::string_view value = takeUpTo(text, ':');
    if (value.empty()) continue;
    MetricValue& read = values.emplace_back();
    if (!parseNumber(value, read) || (type == LineType::Duration && read.number < 0)) {
      return Refusal::Value;
    }
  }
  if (values.empty()) return Refusal::Value;
  return std::nullopt;
}

}  // namespace

std::optional<Refusal> parseMetricLine(std::string_view line, MetricLine& metric,
                                       std::vector<MetricValue>& values) {
  if (line.starts_with("_e{") || line.starts_with("_sc|")) return Refusal::Event;
  const std::size_t colon = findIn(line, ':');
  if (colon == std::string_view::npos) return Refusal::Malformed;
  metric.name = line.substr(0, colon);
  if (findIn(metric.name, '|') != std::string_view::npos) return Refusal::Malformed;
  if (metric.name.empty()) return Refusal::Name;
  std::string_view rest = line.substr(colon + 1);
  const std::size_t bar = findIn(rest, '|');
  if (bar == std::string_view::npos) return Refusal::Malformed;
  const std::string_view valueText = rest.substr(0, bar);
  rest.remove_prefix(bar + 1);
  if (const auto refused = typeOf(takeUpTo(rest, '|'), metric.type)) return refused;
  metric.tags = {};
  metric.rate = 1;
  metric.skippedSections = 0;
  if (const auto refused = readSections(rest, metric)) return refused;
  return readValues(valueText, metric.type, values);
}

std::optional<std::string_view> tagValue(std::string_view tags, std::string_view tag) {
  while (!tags.empty()) {
    const std::string_view entry = takeUpTo(tags, ',');
    if (!entry.starts_with(tag)) continue;
    if (entry.size() == tag.size()) return std::string_view();
    if (entry[tag.size()] == ':') return entry.substr(tag.size() + 1);
  }
  return std::nullopt;
}

}  // namespace tally
